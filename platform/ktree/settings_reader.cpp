#include "ktree/settings_reader.h"

#include <expat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <new>
#include <vector>

#include "ktree/element_text.h"
#include "ktree/limits.h"
#include "ktree/path.h"
#include "ktree/xml_text.h"

namespace ktree {
namespace {

constexpr int kChunk = 65536;

// A tag or comment longer than this is refused: the parser keeps an unfinished one and reads it again with
// every chunk that comes.
constexpr size_t kMaxToken = size_t{1} << 20;

// An element that has begun and not ended.
struct OpenElement {
  Node* node;
  size_t path_length;  // of the shortest path that names the node
  ElementText text;
  bool no_value = false;  // marked as a node without any value
};

class SettingsReader {
 public:
  SettingsReader(Tree& tree, std::string& error);
  SettingsReader(const SettingsReader&) = delete;
  SettingsReader& operator=(const SettingsReader&) = delete;
  ~SettingsReader() { XML_ParserFree(parser_); }

  // Room for the next kChunk bytes of the document.
  [[nodiscard]] void* chunk();

  // Reads the `size` bytes put into chunk(); 0 at the end. Returns false when the document is refused.
  [[nodiscard]] bool feed(size_t size);

  // Refuses the document with `what`; the first refusal stays.
  void refuse(const char* what);

 private:
  static void XMLCALL on_start(void* self, const XML_Char* name, const XML_Char** attributes);
  static void XMLCALL on_end(void* self, const XML_Char* name);
  static void XMLCALL on_text(void* self, const XML_Char* text, int length);
  static void XMLCALL on_doctype(void* self, const XML_Char*, const XML_Char* system, const XML_Char*,
                                 int subset);

  template <typename Act>
  static void call(void* self, Act act);

  void start_element(std::string_view name, const XML_Char** attributes);
  void start_root(std::string_view name);
  void start_node(std::string_view name);
  void read_attribute(std::string_view name, std::string_view value);
  void end_root();
  void end_node();

  Tree& tree_;
  std::string& error_;
  XML_Parser parser_;
  std::vector<OpenElement> open_;
  std::string value_;
  size_t fed_ = 0;
  size_t understood_ = 0;
  bool memory_is_short_ = false;
};

SettingsReader::SettingsReader(Tree& tree, std::string& error)
    : tree_(tree), error_(error), parser_(XML_ParserCreate(nullptr)) {
  if (parser_ == nullptr) throw std::bad_alloc();
  error_.clear();
  XML_SetUserData(parser_, this);
  XML_SetElementHandler(parser_, on_start, on_end);
  XML_SetCharacterDataHandler(parser_, on_text);
  XML_SetStartDoctypeDeclHandler(parser_, on_doctype);
}

void SettingsReader::refuse(const char* what) {
  if (!error_.empty()) return;
  char text[160];
  snprintf(text, sizeof text, "line %lu: %s", static_cast<unsigned long>(XML_GetCurrentLineNumber(parser_)),
           what);
  error_ = text;
  XML_StopParser(parser_, XML_FALSE);
}

void* SettingsReader::chunk() {
  void* room = XML_GetBuffer(parser_, kChunk);
  if (room == nullptr) throw std::bad_alloc();
  return room;
}

bool SettingsReader::feed(size_t size) {
  if (XML_ParseBuffer(parser_, static_cast<int>(size), size == 0) != XML_STATUS_OK) {
    if (memory_is_short_ || XML_GetErrorCode(parser_) == XML_ERROR_NO_MEMORY) throw std::bad_alloc();
    refuse(XML_ErrorString(XML_GetErrorCode(parser_)));
    return false;
  }
  fed_ += size;
  understood_ =
      std::max(understood_, static_cast<size_t>(std::max<XML_Index>(0, XML_GetCurrentByteIndex(parser_))));
  if (fed_ > kMaxDocumentBytes || fed_ - understood_ > kMaxToken) refuse("a document that is too long");
  return error_.empty();
}

// Carries out what the parser calls for, unless the document is refused already. The parser is C: an
// exception must not pass through it, and is thrown again after it.
template <typename Act>
void SettingsReader::call(void* self, Act act) {
  auto* reader = static_cast<SettingsReader*>(self);
  if (reader->memory_is_short_ || !reader->error_.empty()) return;
  try {
    act(*reader);
  } catch (const std::bad_alloc&) {
    reader->memory_is_short_ = true;
    XML_StopParser(reader->parser_, XML_FALSE);
  }
}

void XMLCALL SettingsReader::on_start(void* self, const XML_Char* name, const XML_Char** attributes) {
  call(self, [&](SettingsReader& reader) { reader.start_element(name, attributes); });
}

void SettingsReader::start_element(std::string_view name, const XML_Char** attributes) {
  if (open_.empty()) {
    start_root(name);
  } else {
    start_node(name);
  }
  for (; *attributes != nullptr && error_.empty(); attributes += 2) {
    read_attribute(attributes[0], attributes[1]);
  }
}

void XMLCALL SettingsReader::on_end(void* self, const XML_Char*) {
  call(self, [](SettingsReader& reader) {
    if (reader.open_.size() == 1) {
      reader.end_root();
    } else {
      reader.end_node();
    }
  });
}

void XMLCALL SettingsReader::on_text(void* self, const XML_Char* text, int length) {
  call(self, [&](SettingsReader& reader) {
    if (!reader.open_.back().text.add({text, static_cast<size_t>(length)})) {
      reader.refuse("a value of more than 65535 bytes");
    }
  });
}

// A document type can declare entities, whose expansion may fill any memory, or leave them to a file
// elsewhere.
void XMLCALL SettingsReader::on_doctype(void* self, const XML_Char*, const XML_Char* system, const XML_Char*,
                                        int subset) {
  if (system != nullptr || subset != 0) {
    call(self, [](SettingsReader& reader) { reader.refuse("a document type declaration"); });
  }
}

void SettingsReader::start_root(std::string_view name) {
  if (name != "config") {
    refuse("the root element is not config");
    return;
  }
  open_.push_back({&tree_.root(), 0, {}});
}

void SettingsReader::start_node(std::string_view name) {
  OpenElement& parent = open_.back();
  parent.text.begin_child();
  if (!valid_name(name)) {
    refuse("a name that is not allowed");
    return;
  }
  Node* node = tree_.append_child(*parent.node, name);
  if (node == nullptr) {
    refuse("more than 4096 elements of one name, or a tree that is too large");
    return;
  }
  const size_t path_length =
      parent.path_length + 1 + name.size() + number_length(node->group->members.size());
  if (path_length > kMaxPathBytes) {
    refuse("a path of more than 1023 bytes");
    return;
  }
  open_.push_back({node, path_length, {}});
}

// Attributes that say nothing about the value are another program's and mean nothing.
void SettingsReader::read_attribute(std::string_view name, std::string_view value) {
  OpenElement& element = open_.back();
  if (name == kEncodingAttribute) {
    if (value != kBase64) refuse("an encoding that is not base64");
    element.text.set_encoded();
  } else if (name == kValueAttribute) {
    if (value != kNoValue) refuse("a value attribute that is not none");
    element.no_value = true;
  }
}

void SettingsReader::end_root() {
  bool present = false;
  open_.back().text.begin_child();
  const char* wrong = open_.back().text.finish(value_, present);
  if (wrong != nullptr || present) refuse("text outside every node");
  open_.pop_back();
}

void SettingsReader::end_node() {
  OpenElement& element = open_.back();
  bool present = false;
  const char* wrong = element.text.finish(value_, present);
  if (wrong == nullptr && element.no_value) {
    wrong = value_.empty() ? nullptr : "a value in a node marked to have none";
    present = false;
  }
  if (wrong == nullptr && present && !tree_.set_value(*element.node, value_)) {
    wrong = "a tree that is too large";
  }
  if (wrong != nullptr) refuse(wrong);
  open_.pop_back();
}

// Feeds the reader with what read(buffer, size) gives until it gives 0; negative is a failure.
template <typename Read>
bool read_all(SettingsReader& reader, Read read) {
  for (;;) {
    const ssize_t size = read(reader.chunk(), static_cast<size_t>(kChunk));
    if (size < 0) {
      reader.refuse("the document cannot be read");
      return false;
    }
    if (!reader.feed(static_cast<size_t>(size))) return false;
    if (size == 0) return true;
  }
}

}  // namespace

bool read_settings(int fd, Tree& tree, std::string& error) {
  SettingsReader reader(tree, error);
  off_t offset = 0;
  return read_all(reader, [&](void* buffer, size_t size) {
    ssize_t n = 0;
    do {
      n = pread(fd, buffer, size, offset);
    } while (n < 0 && errno == EINTR);
    offset += std::max<ssize_t>(n, 0);
    return n;
  });
}

bool read_settings(std::string_view document, Tree& tree, std::string& error) {
  SettingsReader reader(tree, error);
  return read_all(reader, [&](void* buffer, size_t size) {
    size_t part = std::min(size, document.size());
    memcpy(buffer, document.data(), part);
    document.remove_prefix(part);
    return static_cast<ssize_t>(part);
  });
}

}  // namespace ktree
