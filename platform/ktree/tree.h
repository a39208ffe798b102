// The configuration tree in memory: nodes in the order in which they were made, and by name and number.
//
// `name:N` is the N-th child of that name. Taking one out moves the later ones of the same name down by one.
#ifndef PLATFORM_KTREE_TREE_H
#define PLATFORM_KTREE_TREE_H

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "ktree/limits.h"
#include "ktree/path.h"

namespace ktree {

struct Node;

// The children of one name below one node; member N - 1 is `name:N`.
struct Group {
  std::string name;
  std::vector<Node*> members;
  unsigned visited = 0;  // used by for_each_child alone
};

// Sorted by name.
using Groups = std::vector<std::unique_ptr<Group>>;

// A node. It may hold a value, children, both, or (when it was made to fill up to a number) nothing.
struct Node {
  Group* group = nullptr;  // null in the root
  Node* previous = nullptr;
  Node* next = nullptr;
  Node* first_child = nullptr;
  Node* last_child = nullptr;
  std::unique_ptr<Groups> groups;  // null in most nodes, which have never had children
  std::unique_ptr<char[]> text;    // null: no value
  uint32_t size = 0;

  [[nodiscard]] bool has_value() const { return text != nullptr; }
  [[nodiscard]] std::string_view value() const { return {text.get(), size}; }
};

// Calls visit(child, number) for the children of `node` in the order in which they were made.
template <typename Visit>
void for_each_child(const Node& node, Visit visit) {
  if (node.groups == nullptr) return;
  for (const auto& group : *node.groups) group->visited = 0;
  for (const Node* child = node.first_child; child != nullptr; child = child->next) {
    visit(*child, ++child->group->visited);
  }
}

class Tree {
 public:
  Tree() = default;
  Tree(const Tree&) = delete;
  Tree& operator=(const Tree&) = delete;
  ~Tree();

  // Sets the node at `path` to `value` and makes what is missing on the way, also the nodes before `name:N`.
  // Returns false, with nothing changed, when the tree would get larger than a tree may be; throws
  // std::bad_alloc, with nothing changed either, when memory is short.
  [[nodiscard]] bool set(const Path& path, std::string_view value);

  // The node at `path`, or null.
  [[nodiscard]] const Node* find(const Path& path) const;

  // Deletes the node at `path` with all below it. Returns false when there is none.
  [[nodiscard]] bool remove(const Path& path);

  [[nodiscard]] const Node& root() const { return root_; }
  [[nodiscard]] size_t node_count() const { return node_count_; }

  // For building a tree from a document. Both return false or null, with nothing changed, when a limit is
  // met, and throw std::bad_alloc, with nothing changed, when memory is short.
  [[nodiscard]] Node* append_child(Node& parent, std::string_view name);
  [[nodiscard]] bool set_value(Node& node, std::string_view value);
  [[nodiscard]] Node& root() { return root_; }

  void swap(Tree& other) noexcept;

 private:
  // What a set adds to the tree.
  struct Growth {
    size_t nodes;
    size_t bytes;
  };

  [[nodiscard]] bool fits(Growth growth) const;
  [[nodiscard]] Growth growth_by(const Node& from, const Path& path, size_t existing,
                                 std::string_view value) const;
  [[nodiscard]] Node* make_path(Node* node, const Path& path, size_t existing);
  void take_out(Node& parent, Node& node, unsigned number);
  void shrink_to(Node& parent, std::string_view name, size_t members);
  [[nodiscard]] Node* make_child(Node& parent, std::string_view name);
  void store_value(Node& node, std::string_view value);
  void destroy(Node* node);

  Node root_;
  size_t node_count_ = 0;  // without the root
  size_t bytes_ = 0;       // of names and values
};

}  // namespace ktree

#endif
