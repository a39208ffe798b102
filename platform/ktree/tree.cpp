#include "ktree/tree.h"

#include <algorithm>
#include <cstring>
#include <new>
#include <utility>

namespace ktree {
namespace {

auto group_position(Groups& groups, std::string_view name) {
  return std::lower_bound(groups.begin(), groups.end(), name,
                          [](const std::unique_ptr<Group>& group, std::string_view wanted) {
                            return std::string_view(group->name) < wanted;
                          });
}

Group* find_group(const Node& parent, std::string_view name) {
  if (parent.groups == nullptr) return nullptr;
  auto position = group_position(*parent.groups, name);
  return position != parent.groups->end() && (*position)->name == name ? position->get() : nullptr;
}

size_t members_of(const Node& parent, std::string_view name) {
  const Group* group = find_group(parent, name);
  return group == nullptr ? 0 : group->members.size();
}

Node* find_child(const Node& parent, const Element& element) {
  Group* group = find_group(parent, element.name());
  return group == nullptr || element.number > group->members.size() ? nullptr
                                                                    : group->members[element.number - 1];
}

void unlink_sibling(Node& parent, Node& node) {
  (node.previous == nullptr ? parent.first_child : node.previous->next) = node.next;
  (node.next == nullptr ? parent.last_child : node.next->previous) = node.previous;
}

void leave_group(Node& parent, Node& node, unsigned number) {
  Group* group = node.group;
  group->members.erase(group->members.begin() + (number - 1));
  if (group->members.empty()) parent.groups->erase(group_position(*parent.groups, group->name));
}

}  // namespace

Tree::~Tree() {
  while (root_.first_child != nullptr) destroy(std::exchange(root_.first_child, root_.first_child->next));
}

const Node* Tree::find(const Path& path) const {
  const Node* node = &root_;
  for (size_t i = 0; i < path.depth && node != nullptr; i++) node = find_child(*node, path.elements[i]);
  return node;
}

bool Tree::fits(Growth growth) const {
  return growth.nodes <= kMaxNodes - node_count_ && growth.bytes <= kMaxTreeBytes - bytes_;
}

// What is to be made below `from`, which the first `existing` elements of the path lead to.
Tree::Growth Tree::growth_by(const Node& from, const Path& path, size_t existing,
                             std::string_view value) const {
  Growth growth = {0, existing == path.depth && value.size() <= from.size ? 0 : value.size()};
  for (size_t i = existing; i < path.depth; i++) {
    const Element& element = path.elements[i];
    const size_t made = element.number - (i == existing ? members_of(from, element.name()) : 0);
    growth.nodes += made;
    growth.bytes += made * element.name().size();
  }
  return growth;
}

Node* Tree::make_path(Node* node, const Path& path, size_t existing) {
  for (size_t i = existing; i < path.depth; i++) {
    const Element& element = path.elements[i];
    Node* child = nullptr;
    for (size_t have = members_of(*node, element.name()); have < element.number; have++) {
      child = make_child(*node, element.name());
    }
    node = child;
  }
  return node;
}

bool Tree::set(const Path& path, std::string_view value) {
  Node* node = &root_;
  size_t existing = 0;
  for (; existing < path.depth; existing++) {
    Node* child = find_child(*node, path.elements[existing]);
    if (child == nullptr) break;
    node = child;
  }
  if (!fits(growth_by(*node, path, existing, value))) return false;
  if (existing == path.depth) {
    store_value(*node, value);
    return true;
  }
  const std::string_view first_made = path.elements[existing].name();
  const size_t members = members_of(*node, first_made);
  try {
    store_value(*make_path(node, path, existing), value);
  } catch (const std::bad_alloc&) {
    shrink_to(*node, first_made, members);
    throw;
  }
  return true;
}

// Takes `node`, the child `number` of its name below `parent`, out of the tree and frees it.
void Tree::take_out(Node& parent, Node& node, unsigned number) {
  bytes_ -= node.group->name.size();
  unlink_sibling(parent, node);
  leave_group(parent, node, number);
  node.group = nullptr;
  destroy(&node);
}

void Tree::shrink_to(Node& parent, std::string_view name, size_t members) {
  for (size_t have = members_of(parent, name); have > members; have--) {
    take_out(parent, *find_group(parent, name)->members.back(), static_cast<unsigned>(have));
  }
}

bool Tree::remove(const Path& path) {
  Node* parent = nullptr;
  Node* node = &root_;
  for (size_t i = 0; i < path.depth; i++) {
    parent = std::exchange(node, find_child(*node, path.elements[i]));
    if (node == nullptr) return false;
  }
  if (parent == nullptr) return false;
  take_out(*parent, *node, path.elements[path.depth - 1].number);
  return true;
}

Node* Tree::append_child(Node& parent, std::string_view name) {
  if (members_of(parent, name) >= kMaxNumber || !fits({1, name.size()})) return nullptr;
  return make_child(parent, name);
}

bool Tree::set_value(Node& node, std::string_view value) {
  if (value.size() > kMaxValueBytes || !fits({0, value.size()})) return false;
  store_value(node, value);
  return true;
}

void Tree::swap(Tree& other) noexcept {
  std::swap(root_, other.root_);
  std::swap(node_count_, other.node_count_);
  std::swap(bytes_, other.bytes_);
}

// Whatever cannot be had is asked for before anything is changed.
Node* Tree::make_child(Node& parent, std::string_view name) {
  auto made = std::make_unique<Node>();
  if (parent.groups == nullptr) parent.groups = std::make_unique<Groups>();
  auto position = group_position(*parent.groups, name);
  if (position == parent.groups->end() || (*position)->name != name) {
    auto group = std::make_unique<Group>();
    group->name = name;
    group->members.push_back(made.get());
    position = parent.groups->insert(position, std::move(group));
  } else {
    (*position)->members.push_back(made.get());
  }
  Node* node = made.release();
  node->group = position->get();
  node->previous = parent.last_child;
  (parent.last_child == nullptr ? parent.first_child : parent.last_child->next) = node;
  parent.last_child = node;
  node_count_++;
  bytes_ += name.size();
  return node;
}

void Tree::store_value(Node& node, std::string_view value) {
  if (!node.has_value() || value.size() != node.size) {
    node.text = std::make_unique_for_overwrite<char[]>(value.size());
    bytes_ += value.size() - node.size;
    node.size = static_cast<uint32_t>(value.size());
  }
  if (!value.empty()) memcpy(node.text.get(), value.data(), value.size());
}

// Frees `node`, which nothing leads to any more, and all below it; no deeper than a path can be.
void Tree::destroy(Node* node) {
  if (node->group != nullptr) bytes_ -= node->group->name.size();
  bytes_ -= node->size;
  node_count_--;
  while (node->first_child != nullptr) destroy(std::exchange(node->first_child, node->first_child->next));
  delete node;
}

}  // namespace ktree
