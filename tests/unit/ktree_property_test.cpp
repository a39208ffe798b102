// The tree against a plain model, and trees of random values through a dump and a load.
#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <list>
#include <memory>
#include <optional>
#include <random>
#include <string>
#include <vector>

#include "ktree_support.h"

namespace ktree {
namespace {

// The model: a node is a value and a list of named children in the order in which they were made. All is
// found by counting.
struct Model {
  std::string name;
  std::optional<std::string> value;
  std::list<Model> children;

  using Child = std::list<Model>::iterator;

  Child find(const std::string& wanted, unsigned number) {
    for (Child child = children.begin(); child != children.end(); ++child) {
      if (child->name == wanted && --number == 0) return child;
    }
    return children.end();
  }

  void list(const std::string& path, std::string& out) const {
    if (value) out += path + "=" + *value + "\n";
    for (auto child = children.begin(); child != children.end(); ++child) {
      unsigned number = 1;
      for (auto before = children.begin(); before != child; ++before) number += before->name == child->name;
      std::string element = "/" + child->name;
      if (number > 1 || child->name == "id") element += ":" + std::to_string(number);
      child->list(path + element, out);
    }
  }
};

struct Step {
  std::string name;
  unsigned number;
};

class Random {
 public:
  explicit Random(unsigned seed) : engine_(seed) {}
  unsigned below(unsigned limit) { return std::uniform_int_distribution<unsigned>(0, limit - 1)(engine_); }

  std::vector<Step> path() {
    static const char* const kNames[] = {"a", "b", "id", "lun"};
    std::vector<Step> steps;
    do {
      steps.push_back({kNames[below(4)], below(4) == 0 ? 1 + below(4) : 1});
    } while (below(3) != 0 && steps.size() < 5);
    return steps;
  }

  // Bytes of every kind, with those that are awkward in XML more often than chance has them.
  std::string value() {
    static const std::vector<std::string> kPieces = {" ",
                                                     "\n",
                                                     "\t",
                                                     "\r",
                                                     "\r\n",
                                                     "&",
                                                     "<",
                                                     ">",
                                                     "]]>",
                                                     "\"",
                                                     "x",
                                                     "iqn.2026",
                                                     "\x01",
                                                     "\x7F",
                                                     "\xC3\xA4",
                                                     "\xEF\xBF\xBE",
                                                     "\xEF\xBF\xBD",
                                                     "\xED\xA0\x80",
                                                     "\xF0\x9F\x98\x80",
                                                     "\xC3",
                                                     "\\"};
    std::string text;
    const unsigned pieces = below(8) == 0 ? below(200) : below(5);
    for (unsigned i = 0; i < pieces; i++) {
      text += below(3) == 0 ? std::string(1, static_cast<char>(1 + below(255))) : kPieces[below(21)];
    }
    return text;
  }

 private:
  std::mt19937 engine_;
};

std::string spell(const std::vector<Step>& steps, Random& random) {
  std::string text;
  for (const Step& step : steps) {
    text += "/" + step.name;
    if (step.number > 1 || random.below(2) == 0) text += ":" + std::to_string(step.number);
  }
  return text;
}

void model_set(Model& root, const std::vector<Step>& steps, const std::string& value) {
  Model* node = &root;
  for (const Step& step : steps) {
    while (node->find(step.name, step.number) == node->children.end()) {
      node->children.push_back({step.name, std::nullopt, {}});
    }
    node = &*node->find(step.name, step.number);
  }
  node->value = value;
}

Model* model_find(Model& root, const std::vector<Step>& steps) {
  Model* node = &root;
  for (const Step& step : steps) {
    auto child = node->find(step.name, step.number);
    if (child == node->children.end()) return nullptr;
    node = &*child;
  }
  return node;
}

bool model_remove(Model& root, std::vector<Step> steps) {
  const Step last = steps.back();
  steps.pop_back();
  Model* parent = model_find(root, steps);
  if (parent == nullptr || parent->find(last.name, last.number) == parent->children.end()) return false;
  parent->children.erase(parent->find(last.name, last.number));
  return true;
}

class AgainstModel : public testing::TestWithParam<unsigned> {};

TEST_P(AgainstModel, SetsDeletesAndReadsAgree) {
  Random random(GetParam());
  Tree tree;
  Model model;
  for (int i = 0; i < 400; i++) {
    const std::vector<Step> steps = random.path();
    const std::string path = spell(steps, random);
    switch (random.below(4)) {
      case 0:
      case 1: {
        const std::string value = std::to_string(i);
        ASSERT_TRUE(set(tree, path, value));
        model_set(model, steps, value);
        break;
      }
      case 2:
        ASSERT_EQ(remove(tree, path), model_remove(model, steps)) << path;
        break;
      default: {
        Model* node = model_find(model, steps);
        ASSERT_EQ(exists(tree, path), node != nullptr) << path;
        ASSERT_EQ(get(tree, path), node == nullptr ? std::nullopt : node->value) << path;
      }
    }
  }
  std::string expected;
  model.list("", expected);
  EXPECT_EQ(list(tree), expected);
}

INSTANTIATE_TEST_SUITE_P(Seeds, AgainstModel, testing::Range(0U, 100U));

// A tree of random shape and values.
void fill(Tree& tree, Random& random) {
  for (int i = 0; i < 60; i++) ASSERT_TRUE(set(tree, spell(random.path(), random), random.value()));
  for (int i = 0; i < 10; i++) static_cast<void>(remove(tree, spell(random.path(), random)));
}

class RandomTree : public testing::TestWithParam<unsigned> {};

TEST_P(RandomTree, ComesBackFromADumpByteForByte) {
  Random random(GetParam());
  Tree tree;
  Tree copy;
  std::string error;
  fill(tree, random);
  const std::string document = dump(tree);
  ASSERT_TRUE(read_settings(document, copy, error)) << error << document;
  EXPECT_EQ(list(copy), list(tree));
  EXPECT_EQ(dump(copy), document);
  EXPECT_EQ(copy.node_count(), tree.node_count());
}

INSTANTIATE_TEST_SUITE_P(Seeds, RandomTree, testing::Range(0U, 200U));

TEST(RandomTrees, AreWellFormedForAnotherReader) {
  char folder[] = "/tmp/ktree_property_XXXXXX";
  ASSERT_NE(mkdtemp(folder), nullptr);
  std::string command = "xmllint --noout --nonet";
  for (unsigned seed = 0; seed < 200; seed++) {
    Random random(seed);
    Tree tree;
    fill(tree, random);
    const std::string file = std::string(folder) + "/" + std::to_string(seed) + ".xml";
    const std::string document = dump(tree);
    std::unique_ptr<FILE, int (*)(FILE*)> out(fopen(file.c_str(), "w"), fclose);
    ASSERT_NE(out, nullptr);
    ASSERT_EQ(fwrite(document.data(), 1, document.size(), out.get()), document.size());
    command += " " + file;
  }
  EXPECT_EQ(system(command.c_str()), 0);
  ASSERT_EQ(system((std::string("rm -r ") + folder).c_str()), 0);
}

}  // namespace
}  // namespace ktree
