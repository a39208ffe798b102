// Texts of users as UTF-8.
#include "common/utf8.h"

#include <gtest/gtest.h>

#include <string>

namespace platform {
namespace {

std::string encoded(wchar_t character) {
  const auto code = static_cast<unsigned>(character);
  const auto tail = [code](int shift) { return static_cast<char>(0x80 | ((code >> shift) & 0x3f)); };
  if (code < 0x80) return {static_cast<char>(code)};
  if (code < 0x800) return {static_cast<char>(0xc0 | code >> 6), tail(0)};
  if (code < 0x10000) return {static_cast<char>(0xe0 | code >> 12), tail(6), tail(0)};
  return {static_cast<char>(0xf0 | code >> 18), tail(12), tail(6), tail(0)};
}

TEST(Utf8, EveryCharacterIsDecodedAndNoSurrogateIs) {
  for (unsigned code = 1; code <= 0x110005; ++code) {
    const auto character = static_cast<wchar_t>(code);
    const bool wanted = code <= 0x10ffff && (code < 0xd800 || code > 0xdfff);
    std::wstring characters;
    ASSERT_EQ(decode("a" + encoded(character) + "b", characters), wanted) << std::hex << code;
    const std::wstring whole = {L'a', character, L'b'};
    ASSERT_TRUE(characters == (wanted ? whole : std::wstring())) << std::hex << code;
  }
}

TEST(Utf8, NoTextThatIsCutOrTooLongIsDecoded) {
  std::wstring characters;
  for (const char* text : {"\x80", "\xbf", "\xc0\x80", "\xc1\xbf", "\xc3", "\xe0\x80\x80", "\xe0\x9f\xbf",
                           "\xe2\x82", "\xf0\x80\x80\x80", "\xf0\x8f\xbf\xbf", "\xf0\x9f\x98",
                           "\xf4\x90\x80\x80", "\xf8\x88\x80\x80\x80", "\xff", "\xc3(", "\xe2\x28\xa1"}) {
    EXPECT_FALSE(decode(text, characters)) << printable(text);
    EXPECT_TRUE(characters.empty());
  }
}

TEST(Utf8, PrintableTextHasNoControlCharacter) {
  EXPECT_EQ(printable("Fotos 日本 é"), "Fotos 日本 é");
  EXPECT_EQ(printable("a\nb\x1b[31m\x7f"), "a\\x0Ab\\x1B[31m\\x7F");
  EXPECT_EQ(printable("\xc2\x85\xe2\x80\xa8"), "\\xC2\\x85\\xE2\\x80\\xA8");
  EXPECT_EQ(printable("é\xff"
                      "b"),
            "\\xC3\\xA9\\xFFb");
  EXPECT_EQ(printable("a\u202eb\u200d"), "a\\xE2\\x80\\xAEb\\xE2\\x80\\x8D");
  for (const char* text : {"❤\ufe0f", "👨\u200d👩\u200d👧", "1\ufe0f\u20e3", "می\u200cخواهم"}) {
    EXPECT_EQ(printable(text), text);
  }
  EXPECT_EQ(printable("1\ufe0f"), "1\\xEF\\xB8\\x8F");
  EXPECT_EQ(printable("\u200d"), "\\xE2\\x80\\x8D");
  EXPECT_EQ(printable(""), "");
}

TEST(Utf8, WhatIsNotSeenIsKnown) {
  for (const wchar_t character :
       L"\u00ad\u034f\u061c\u200b\u200e\u200f\u202a\u202e\u2060\u2066\u2069\u3164\ufeff") {
    EXPECT_EQ(is_invisible(character), character != L'\0') << std::hex << static_cast<unsigned>(character);
  }
  for (const wchar_t character : L"a é日ا\u0301\u2010\u202f\u3000😀") {
    EXPECT_FALSE(is_invisible(character)) << std::hex << static_cast<unsigned>(character);
  }
}

TEST(Utf8, CellsAreWhatATerminalTakes) {
  EXPECT_EQ(cells("abc"), 3U);
  EXPECT_EQ(cells("日本"), 4U);
  EXPECT_EQ(cells("e\xcc\x81"), 1U);
  EXPECT_EQ(cells(""), 0U);
}

TEST(Utf8, Ascii) {
  EXPECT_EQ(ascii("a b\x7f"), "a b\x7f");
  EXPECT_EQ(ascii("\xc3\xa9x\xff"), "\\xC3\\xA9x\\xFF");
}

TEST(Utf8, LowerCase) {
  EXPECT_EQ(lower_case(L'A'), L'a');
  EXPECT_EQ(lower_case(L'['), L'[');
  EXPECT_EQ(lower_case(L'Ä'), L'ä');
  EXPECT_EQ(lower_case(L'Σ'), L'σ');
  EXPECT_EQ(lower_case(L'日'), L'日');
}

}  // namespace
}  // namespace platform
