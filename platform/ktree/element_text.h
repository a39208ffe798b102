// The text of one element of a settings file, gathered piece by piece, and the value it stands for.
#ifndef PLATFORM_KTREE_ELEMENT_TEXT_H
#define PLATFORM_KTREE_ELEMENT_TEXT_H

#include <string>
#include <string_view>

namespace ktree {

// Holds no more than a value can need, however much white space surrounds the text or separates the children.
class ElementText {
 public:
  // The value is written as base64. Called before any text.
  void set_encoded() { encoded_ = true; }

  // Takes the next piece of text. Returns false when the text is too long for a value.
  [[nodiscard]] bool add(std::string_view piece);

  // A child element begins: from now on white space around the text is layout.
  void begin_child();

  // The element ends. Puts the value into `value` and sets `present`; text of white space alone is the empty
  // value without children and no value with them. Returns null, or what is wrong.
  [[nodiscard]] const char* finish(std::string& value, bool& present);

 private:
  [[nodiscard]] bool add_encoded(std::string_view piece);

  std::string text_;
  bool encoded_ = false;
  bool has_children_ = false;
  bool cut_ = false;  // white space after text_ was not kept
};

}  // namespace ktree

#endif
