// How far mke2fs is: on what the real one prints, in reads of every length, and on what it should never
// print.
#include "volume/format_progress.h"

#include <fstream>
#include <optional>
#include <sstream>

#include "fakes.h"

using remvol::FormatProgress;
using remvol::update_format_progress;

namespace {

using Texts = std::vector<std::string>;

// What is recorded on each release of Debian.
constexpr const char* kReleases[] = {"bookworm", "trixie"};
constexpr const char* kSamples[] = {"ext2.iscsi", "ext2.large", "ext2.lazy", "ext2.small",
                                    "ext3.iscsi", "ext3.large", "ext3.lazy", "ext3.small",
                                    "ext4.iscsi", "ext4.large", "ext4.lazy", "ext4.small"};

std::string sample(const std::string& release, const std::string& name) {
  std::ifstream file(SAMPLES "/mke2fs/" + release + "/" + name + ".out");
  std::stringstream text;
  text << file.rdbuf();
  EXPECT_FALSE(text.str().empty()) << release << " " << name;
  return text.str();
}

Texts samples() {
  Texts found;
  for (const char* release : kReleases) {
    for (const char* name : kSamples) found.push_back(sample(release, name));
  }
  return found;
}

// The reads that fgets gives with a buffer for `limit` characters.
Texts reads(const std::string& text, size_t limit) {
  Texts found;
  for (size_t at = 0; at < text.size();) {
    const size_t newline = text.find('\n', at);
    size_t length = newline == std::string::npos ? text.size() - at : newline + 1 - at;
    if (length > limit) length = limit;
    found.push_back(text.substr(at, length));
    at += length;
  }
  return found;
}

// The pieces of the text between runs of backspaces.
Texts pieces(const std::string& text) {
  Texts found = {""};
  for (size_t i = 0; i < text.size(); i++) {
    if (text[i] != '\b') {
      found.back() += text[i];
    } else if (i == 0 || text[i - 1] != '\b') {
      found.push_back("");
    }
  }
  return found;
}

// The percentage by the other road: of the pieces of a read the last but two is the counter, when one stands
// before it.
struct Reference {
  bool groups = false;
  bool inodes = false;
  int percent = 0;

  bool take(const std::string& read) {
    groups = groups || read.find("Allocating group tables") != std::string::npos;
    inodes = inodes || read.find("Writing inode tables") != std::string::npos;
    const Texts parts = pieces(read);
    if (parts.size() < 4) return false;
    long long done = 0;
    long long all = 0;
    const std::string& counter = parts[parts.size() - 3];
    const size_t slash = counter.find('/');
    if (slash == std::string::npos) return false;
    sscanf(counter.c_str(), "%lld", &done);
    sscanf(counter.c_str() + slash + 1, "%lld", &all);
    if (all == 0) return false;
    if (inodes) {
      percent = static_cast<int>(done * 70 / all + 30);
    } else if (groups) {
      percent = static_cast<int>(done * 20 / all + 10);
    }
    return true;
  }
};

// The percentages that are published for these reads.
std::vector<int> published(const Texts& texts) {
  FormatProgress progress{};
  std::vector<int> found;
  for (const std::string& text : texts) {
    if (update_format_progress(&progress, text.c_str())) found.push_back(progress.percent);
  }
  return found;
}

std::optional<int> percent_of(const std::string& text, FormatProgress progress = {}) {
  if (!update_format_progress(&progress, text.c_str())) return std::nullopt;
  return progress.percent;
}

class FormatProgressTest : public fakes::Test {};

}  // namespace

TEST_F(FormatProgressTest, TheCounterBeforeTheLastRedrawCounts) {
  EXPECT_EQ(percent_of("Writing inode tables: 12/40\b\b\b\b\b13/40\b\b\b\b\b14/40\b\b\b\b\b"), 52);
  EXPECT_EQ(percent_of("Allocating group tables: 2/8\b\b\b3/8\b\b\b4/8\b\b\b"), 17);
}

TEST_F(FormatProgressTest, AMarkLastsForTheFollowingReads) {
  FormatProgress progress{};
  EXPECT_FALSE(update_format_progress(&progress, "Allocating group tables: done\n"));
  EXPECT_EQ(percent_of("\b1/4\b\b\b2/4\b\b\b3/4\b", progress), 20);
  EXPECT_FALSE(update_format_progress(&progress, "Writing inode tables: "));
  EXPECT_EQ(percent_of("\b1/4\b\b\b2/4\b\b\b3/4\b", progress), 65);
}

TEST_F(FormatProgressTest, ACounterBeforeAnyPhaseLeavesThePercentage) {
  EXPECT_EQ(percent_of("Discarding device blocks: 1/9\b\b\b2/9\b\b\b3/9\b\b\b"), 0);
}

TEST_F(FormatProgressTest, ReadsWithoutACounterAreSkipped) {
  for (const char* text :
       {"", "\n", "\b", "\b\b\b\b", "Writing inode tables: done\n", "Writing inode tables: 1/2",
        "Writing inode tables: 1/2\b\b\b2/2", "Writing inode tables: \b1/2\b\b\bdone"}) {
    EXPECT_EQ(percent_of(text), std::nullopt) << text;
  }
  EXPECT_EQ(percent_of("Writing inode tables: \bno slash\b\b1/2\b\b\b2/2\b\b"), 65)
      << "two redraws follow the 1/2";
  EXPECT_EQ(percent_of("Writing inode tables: \b1/2\b\bno slash\b\b2/2\b\b"), std::nullopt);
}

TEST_F(FormatProgressTest, ADenominatorOfZeroIsSkipped) {
  FormatProgress progress{false, true, 42};
  EXPECT_FALSE(update_format_progress(&progress, "\b1/0\b2/0\b3/0\b"));
  EXPECT_FALSE(update_format_progress(&progress, "\b1/x\b2/x\b3/x\b"));
  EXPECT_EQ(progress.percent, 42);
}

TEST_F(FormatProgressTest, NumbersBeyondAllBoundsChangeNothing) {
  FormatProgress progress{false, true, 42};
  EXPECT_FALSE(update_format_progress(&progress, "\b9223372036854775807/1\b2/2\b\b"));
  EXPECT_FALSE(update_format_progress(&progress, "\b-9223372036854775808/-1\b2/2\b\b"));
  EXPECT_FALSE(update_format_progress(&progress, "\b99999999999/1\b2/2\b\b"));
  EXPECT_EQ(progress.percent, 42);
}

TEST_F(FormatProgressTest, RealOutputInReadsOfEveryLength) {
  for (const std::string& text : samples()) {
    for (size_t limit = 1; limit < remvol::kFormatReadSize; limit++) {
      FormatProgress progress{};
      Reference reference;
      for (const std::string& read : reads(text, limit)) {
        ASSERT_EQ(update_format_progress(&progress, read.c_str()), reference.take(read))
            << text << " " << limit;
        ASSERT_EQ(progress.percent, reference.percent) << text << " " << limit << " " << read;
        ASSERT_TRUE(progress.percent >= 0 && progress.percent <= 100) << text << " " << limit;
      }
    }
  }
}

TEST_F(FormatProgressTest, RealOutputCutAtEveryPlace) {
  for (const std::string& text : samples()) {
    for (size_t cut = 0; cut <= text.size(); cut++) {
      FormatProgress progress{};
      Reference reference;
      for (const std::string& half : {text.substr(0, cut), text.substr(cut)}) {
        for (const std::string& read : reads(half, remvol::kFormatReadSize - 1)) {
          ASSERT_EQ(update_format_progress(&progress, read.c_str()), reference.take(read))
              << text << " " << cut;
          ASSERT_EQ(progress.percent, reference.percent) << text << " " << cut;
        }
      }
    }
  }
}

TEST_F(FormatProgressTest, RealDisksAsTheyAreRead) {
  // Where each phase is over within a second, nothing is. The samples of trixie are those of a busier
  // machine.
  const struct {
    const char* release;
    const char* name;
    std::vector<int> percentages;
  } rows[] = {
      {"bookworm", "ext2.small", {}},
      {"bookworm", "ext3.small", {}},
      {"bookworm", "ext4.small", {}},
      {"bookworm", "ext2.iscsi", {}},
      {"bookworm", "ext3.iscsi", {}},
      {"bookworm", "ext4.iscsi", {}},
      {"bookworm", "ext2.lazy", {}},
      {"bookworm", "ext3.lazy", {}},
      {"bookworm", "ext4.lazy", {}},
      {"bookworm", "ext2.large", {99}},
      {"bookworm", "ext3.large", {99}},
      {"bookworm", "ext4.large", {98}},  // the inode tables' line is one read
      {"trixie", "ext2.small", {}},
      {"trixie", "ext3.small", {}},
      {"trixie", "ext4.small", {}},
      {"trixie", "ext2.iscsi", {}},
      {"trixie", "ext3.iscsi", {}},
      {"trixie", "ext4.iscsi", {}},
      {"trixie", "ext2.lazy", {36}},
      {"trixie", "ext3.lazy", {}},
      {"trixie", "ext4.lazy", {86}},
      {"trixie", "ext2.large", {65, 99}},
      {"trixie", "ext3.large", {67, 97, 99}},
      {"trixie", "ext4.large", {92, 30}},  // the last of it is the counter of the superblocks
  };
  for (const auto& [release, name, percentages] : rows) {
    EXPECT_EQ(published(reads(sample(release, name), remvol::kFormatReadSize - 1)), percentages)
        << release << " " << name;
  }
}

// A phase of several hundred redraws, in mke2fs's form. The counter of the superblocks, which follows the
// inode tables, is taken like theirs.
TEST_F(FormatProgressTest, ASlowDiskIsPublishedRedrawByRedraw) {
  const auto phase = [](const char* name) {
    std::string text = name;
    for (int n = 0; n < 400; n++) {
      char counter[32];
      snprintf(counter, sizeof counter, "%3d/400%s", n, std::string(7, '\b').c_str());
      text += counter;
    }
    return text + std::string(7, ' ') + std::string(7, '\b') + "done                            \n";
  };
  const std::string text = phase("Allocating group tables: ") + phase("Writing inode tables: ") +
                           phase("Writing superblocks and filesystem accounting information: ");
  EXPECT_EQ(published(reads(text, remvol::kFormatReadSize - 1)),
            (std::vector<int>{13, 17, 20, 24, 28, 29, 42, 55, 67, 80, 93, 99, 41, 54, 67, 80, 92, 99}));
}

TEST_F(FormatProgressTest, ARedrawInAReadOfItsOwnIsSkipped) {
  EXPECT_EQ(published({"Writing inode tables:   0/400", "\b\b\b\b\b\b\b  1/400", "\b\b\b\b\b\b\b  2/400"}),
            std::vector<int>{});
}
