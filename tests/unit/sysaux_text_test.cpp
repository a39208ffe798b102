// Text helpers of the platform, and the shell runner in front of a system() of the test's own.
#include <gtest/gtest.h>
#include <limits.h>
#include <stdio.h>
#include <string.h>
#include <sys/wait.h>

#include <random>
#include <string>
#include <vector>

#include "sysaux.h"

namespace {

std::string last_command;
int next_status = 0;

}  // namespace

// Takes the place of the C library's for the whole program, the platform library included.
extern "C" __attribute__((visibility("default"))) int system(const char* command) {
  last_command = command;
  return next_status;
}

namespace {

TEST(System, FormatsTheCommandAndReturnsWhatSystemReturns) {
  next_status = 0x300;
  EXPECT_EQ(System("mount -t %s %s \"%s\" %d %lld", "ext4", "/dev/sdb1", "/mnt/VV/a b", -7, 1LL << 40),
            0x300);
  EXPECT_EQ(last_command, "mount -t ext4 /dev/sdb1 \"/mnt/VV/a b\" -7 1099511627776");
  next_status = -1;
  EXPECT_EQ(System("%%"), -1);
  EXPECT_EQ(last_command, "%");
}

TEST(System, HasNoLimitOfItsOwn) {
  const std::string text(1000000, 'x');
  next_status = 0;
  EXPECT_EQ(System("echo %s", text.c_str()), 0);
  EXPECT_EQ(last_command, "echo " + text);
}

TEST(InsertBackSlash, EscapesTheFourCharactersAndNothingElse) {
  char out[64];
  EXPECT_EQ(str_insert_back_slash(out, sizeof out, "a\"b\\c$d`e!f'g h\ni"), 0);
  EXPECT_STREQ(out, "a\\\"b\\\\c\\$d\\`e!f'g h\ni");
  EXPECT_EQ(str_insert_back_slash(out, sizeof out, ""), 0);
  EXPECT_STREQ(out, "");
}

TEST(InsertBackSlash, EmptiesTheOutputWhenItIsTooSmall) {
  char out[8];
  EXPECT_EQ(str_insert_back_slash(out, 5, "a$b"), 0);
  EXPECT_STREQ(out, "a\\$b");
  for (size_t size = 1; size < 5; ++size) {
    memset(out, 'x', sizeof out);
    EXPECT_EQ(str_insert_back_slash(out, size, "a$b"), -1) << size;
    EXPECT_EQ(out[0], '\0') << size;
    EXPECT_EQ(out[size], 'x') << size;
  }
  EXPECT_EQ(str_insert_back_slash(out, 0, "a"), -1);
  EXPECT_EQ(str_insert_back_slash(nullptr, 8, "a"), -1);
  out[0] = 'x';
  EXPECT_EQ(str_insert_back_slash(out, sizeof out, nullptr), -1);
  EXPECT_STREQ(out, "");
}

std::vector<std::string> sample_texts() {
  std::vector<std::string> texts;
  for (int byte = 1; byte < 256; ++byte) {
    texts.push_back(std::string(1, static_cast<char>(byte)));
    texts.push_back("a" + texts.back() + "b");
    texts.push_back("\\" + std::string(1, static_cast<char>(byte)));
    texts.push_back("$" + std::string(1, static_cast<char>(byte)) + "`id`$(id)${PATH}");
  }
  std::mt19937 random(4711);
  for (int i = 0; i < 2000; ++i) {
    std::string text(random() % 120, ' ');
    for (char& each : text) {
      each = random() % 4 == 0 ? "\"\\$`!\n"[random() % 6] : static_cast<char>(1 + random() % 255);
    }
    texts.push_back(text);
  }
  return texts;
}

class InsertBackSlashInShell : public testing::TestWithParam<const char*> {};

// A script prints every text, each ended by a NUL; what comes back must be what went in.
TEST_P(InsertBackSlashInShell, EveryTextComesBackByteForByte) {
  const std::vector<std::string> texts = sample_texts();
  const std::string script = testing::TempDir() + "sysaux_text_" + std::to_string(getpid());
  std::string expected;
  FILE* file = fopen(script.c_str(), "we");
  ASSERT_NE(file, nullptr);
  for (const std::string& text : texts) {
    std::string quoted(2 * text.size() + 1, '\0');
    ASSERT_EQ(str_insert_back_slash(quoted.data(), quoted.size(), text.c_str()), 0);
    fprintf(file, "printf '%%s\\0' \"%s\"\n", quoted.c_str());
    expected.append(text.c_str(), text.size() + 1);
  }
  ASSERT_EQ(fclose(file), 0);

  FILE* shell = popen((std::string(GetParam()) + " " + script).c_str(), "re");
  ASSERT_NE(shell, nullptr);
  std::string printed;
  char chunk[65536];
  while (const size_t length = fread(chunk, 1, sizeof chunk, shell)) printed.append(chunk, length);
  EXPECT_EQ(pclose(shell), 0);
  EXPECT_TRUE(printed == expected);
  unlink(script.c_str());
}

INSTANTIATE_TEST_SUITE_P(Shells, InsertBackSlashInShell, testing::Values("dash", "bash", "bash --posix"),
                         [](const auto& shell) { return "Shell" + std::to_string(shell.index); });

std::string trimmed(char* (*trim)(char*, const char*), std::string text, const char* set) {
  EXPECT_EQ(trim(text.data(), set), text.data());
  return text.c_str();
}

TEST(Trim, RemovesTheCharactersOfTheSetInPlace) {
  EXPECT_EQ(trimmed(strtrim, " \t a b \n", " \t\n"), "a b");
  EXPECT_EQ(trimmed(strrtrim, " \t a b \n", " \t\n"), " \t a b");
  EXPECT_EQ(trimmed(strtrim, "\b\b12/40\b\b", "\b"), "12/40");
  EXPECT_EQ(trimmed(strrtrim, "12/40\b\b", "\b"), "12/40");
}

TEST(Trim, CopesWithNothingToKeepAndNothingToRemove) {
  for (const auto trim : {strtrim, strrtrim}) {
    EXPECT_EQ(trimmed(trim, "", " "), "");
    EXPECT_EQ(trimmed(trim, "   ", " "), "");
    EXPECT_EQ(trimmed(trim, "abc", " "), "abc");
    EXPECT_EQ(trimmed(trim, " abc ", ""), " abc ");
    EXPECT_EQ(trim(nullptr, " "), nullptr);
  }
}

TEST(Str2ll, ReadsDecimalNumbers) {
  EXPECT_EQ(str2ll("0"), 0);
  EXPECT_EQ(str2ll("12"), 12);
  EXPECT_EQ(str2ll(" \t 12"), 12);
  EXPECT_EQ(str2ll("-5"), -5);
  EXPECT_EQ(str2ll("010"), 10);
  EXPECT_EQ(str2ll("8796093022208\n"), 1LL << 43);
  EXPECT_EQ(str2ll("9223372036854775807"), LLONG_MAX);
}

TEST(Str2ll, GivesZeroForWhatIsNoNumber) {
  for (const char* text : {"", " ", "abc", "-", "x1", "/40"}) EXPECT_EQ(str2ll(text), 0) << text;
  EXPECT_EQ(str2ll(nullptr), 0);
}

TEST(Str2ll, GivesTheNearestForWhatIsTooLarge) {
  EXPECT_EQ(str2ll("9223372036854775808"), LLONG_MAX);
  EXPECT_EQ(str2ll("-99999999999999999999"), LLONG_MIN);
}

}  // namespace
