// The configuration tree in memory.
#include <sys/stat.h>
#include <unistd.h>

#include <cstdlib>
#include <cstring>

#include "fakes.h"
#include "ktreec.h"
#include "shared.h"

namespace fakes {

namespace {

constexpr int kNone = -1;

struct Element {
  std::string name;
  int number;
};

bool is_name(const std::string& text) {
  return match(Expression{"^[A-Za-z_][A-Za-z0-9_.-]*$"}, text).has_value();
}

// Returns whether the path is one of the tree.
bool split(const std::string& path, std::vector<Element>* elements) {
  if (path.size() < 2 || path[0] != '/' || path.size() > 1023) return false;
  for (size_t from = 1; from <= path.size();) {
    size_t to = path.find('/', from);
    if (to == std::string::npos) to = path.size();
    std::string name = path.substr(from, to - from);
    int number = 1;
    const size_t colon = name.find(':');
    if (colon != std::string::npos) {
      const std::string digits = name.substr(colon + 1);
      if (digits.empty() || digits.size() > 4 ||
          digits.find_first_not_of("0123456789") != std::string::npos) {
        return false;
      }
      number = atoi(digits.c_str());
      name.resize(colon);
    }
    if (!is_name(name) || number < 1 || number > 4096) return false;
    elements->push_back({name, number});
    from = to + 1;
  }
  return true;
}

int add_node(int parent, const std::string& name) {
  Shared& all = shared();
  if (all.node_count == std::size(all.nodes) || name.size() >= sizeof(Node::name)) abort();
  Node& node = all.nodes[all.node_count];
  node = Node();
  node.parent = parent;
  node.live = true;
  memcpy(node.name, name.c_str(), name.size() + 1);
  return static_cast<int>(all.node_count++);
}

// The number-th child of that name; makes what is missing when asked to.
int child(int parent, const Element& element, bool make) {
  int left = element.number;
  for (size_t i = 0; i < shared().node_count; i++) {
    const Node& node = shared().nodes[i];
    if (node.live && node.parent == parent && element.name == node.name && --left == 0) {
      return static_cast<int>(i);
    }
  }
  int made = kNone;
  while (make && left-- > 0) made = add_node(parent, element.name);
  return made;
}

int find(const char* socket, const std::string& path, bool make) {
  std::vector<Element> elements;
  if (!split(path, &elements)) return kNone;
  int at = child(-1, {socket == nullptr ? "/var/run/ktree_sock" : socket, 1}, true);
  for (const Element& element : elements) {
    at = child(at, element, make);
    if (at == kNone) return kNone;
  }
  return at;
}

bool put(const char* socket, const std::string& path, const std::string& value) {
  const int at = find(socket, path, true);
  if (at == kNone || value.size() >= sizeof(Node::value)) return false;
  Node& node = shared().nodes[at];
  memcpy(node.value, value.c_str(), value.size() + 1);
  node.has_value = true;
  return true;
}

void remove(int at) {
  shared().nodes[at].live = false;
  for (size_t i = 0; i < shared().node_count; i++) {
    if (shared().nodes[i].live && shared().nodes[i].parent == at) remove(static_cast<int>(i));
  }
}

void collect(int at, const std::string& path, std::map<std::string, std::string>* found) {
  const Node& node = shared().nodes[at];
  if (node.has_value) (*found)[path] = node.value;
  std::map<std::string, int> numbers;
  for (size_t i = 0; i < shared().node_count; i++) {
    const Node& below = shared().nodes[i];
    if (!below.live || below.parent != at) continue;
    const int number = ++numbers[below.name];
    const bool numbered = number > 1 || strcmp(below.name, "id") == 0;
    collect(static_cast<int>(i),
            path + "/" + below.name + (numbered ? ":" + std::to_string(number) : std::string()), found);
  }
}

// What a test puts into the tree, another run has put there: it has locked the slots and counted the change.
void count_slot_change() {
  constexpr char kLock[] = "/run/remvol/slots.lock";
  struct stat info {};
  if (stat(kLock, &info) == 0 && truncate(kLock, info.st_size + 1) != 0) ADD_FAILURE() << kLock;
}

}  // namespace

void tree_set(const Values& values, const char* socket) {
  const Hold hold;
  count_slot_change();
  for (const auto& [path, value] : values) {
    if (!put(socket, path, value)) ADD_FAILURE() << "not a path or value of the tree: " << path;
  }
}

std::optional<std::string> tree_get(const std::string& path, const char* socket) {
  const Hold hold;
  const int at = find(socket, path, false);
  if (at == kNone || !shared().nodes[at].has_value) return std::nullopt;
  return shared().nodes[at].value;
}

void tree_delete(const std::string& path, const char* socket) {
  const Hold hold;
  count_slot_change();
  const int at = find(socket, path, false);
  if (at != kNone) remove(at);
}

std::map<std::string, std::string> tree_dump(const char* socket) {
  const Hold hold;
  std::map<std::string, std::string> found;
  collect(child(-1, {socket, 1}, true), "", &found);
  return found;
}

}  // namespace fakes

extern "C" {

int ktreec_set(const char* socket, unsigned, const char* path, const char* value) {
  fakes::Answer answer;
  fakes::record("set", {path, value});
  if (fakes::answered("ktreec_set", {path, value}, &answer)) return static_cast<int>(answer.result);
  const fakes::Hold hold;
  return fakes::put(socket, path, value) ? 0 : -1;
}

int ktreec_get_wb(const char* socket, unsigned, const char* path, char* buffer, size_t size) {
  fakes::Answer answer;
  if (fakes::answered("ktreec_get_wb", {path}, &answer)) {
    snprintf(buffer, size, "%s", answer.text.c_str());
    return static_cast<int>(answer.result);
  }
  const std::optional<std::string> value =
      fakes::tree_get(path, socket == nullptr ? "/var/run/ktree_sock" : socket);
  if (!value) errno = ENODATA;
  snprintf(buffer, size, "%s", value.value_or("").c_str());
  return value ? static_cast<int>(strlen(buffer)) : -1;
}

int ktreec_del(const char* socket, unsigned, const char* path) {
  fakes::Answer answer;
  fakes::record("del", {path});
  if (fakes::answered("ktreec_del", {path}, &answer)) return static_cast<int>(answer.result);
  const fakes::Hold hold;
  const int at = fakes::find(socket, path, false);
  if (at != fakes::kNone) fakes::remove(at);
  return at == fakes::kNone ? -1 : 0;
}

int ktreec_dump(const char*, unsigned, const char* file) {
  fakes::Answer answer;
  fakes::record("dump", {file});
  return fakes::answered("ktreec_dump", {file}, &answer) ? static_cast<int>(answer.result) : 0;
}

int ktreec_load(const char*, unsigned, const char* file) {
  fakes::Answer answer;
  fakes::record("load", {file});
  return fakes::needs_answer("ktreec_load", {file}, &answer) ? static_cast<int>(answer.result) : -1;
}

}  // extern "C"
