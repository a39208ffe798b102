#include <gtest/gtest.h>

#include <string>

#include "ktree/base64.h"
#include "ktree/xml_text.h"
#include "ktree_support.h"

namespace ktree {
namespace {

constexpr char kHead[] = "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n";

std::string loaded(std::string_view document) {
  Tree tree;
  std::string error;
  return read_settings(document, tree, error) ? list(tree) : error;
}

// The value of /a, with children below it or without, after a dump and a load.
std::string round_trip(std::string_view value, bool has_children) {
  Tree tree;
  Tree copy;
  std::string error;
  if (!set(tree, "/a", value) || (has_children && !set(tree, "/a/b", "child"))) return "not set";
  return read_settings(dump(tree), copy, error) ? get(copy, "/a").value_or("no value") : error;
}

TEST(Dump, IsXmlThatAPersonCanRead) {
  Tree tree;
  ASSERT_TRUE(set(tree, "/iscsi/initiator/id:2/target", "iqn.a <&> b"));
  ASSERT_TRUE(set(tree, "/iscsi/initiator/ver", "1"));
  ASSERT_TRUE(set(tree, "/iscsi", "both"));
  ASSERT_TRUE(set(tree, "/empty", ""));
  ASSERT_TRUE(set(tree, "/bell", "\a"));
  EXPECT_EQ(dump(tree), std::string(kHead) +
                            "<config>\n"
                            " <iscsi>both\n"
                            "  <initiator>\n"
                            "   <id value=\"none\"/>\n"
                            "   <id>\n"
                            "    <target>iqn.a &lt;&amp;&gt; b</target>\n"
                            "   </id>\n"
                            "   <ver>1</ver>\n"
                            "  </initiator>\n"
                            " </iscsi>\n"
                            " <empty/>\n"
                            " <bell encoding=\"base64\">Bw==</bell>\n"
                            "</config>\n");
}

TEST(Dump, OfAnEmptyTreeLoads) {
  EXPECT_EQ(dump(Tree()), std::string(kHead) + "<config>\n</config>\n");
  EXPECT_EQ(loaded(dump(Tree())), "");
}

TEST(Dump, KeepsNodesWithoutAValueApartFromEmptyValues) {
  Tree tree;
  Tree copy;
  std::string error;
  ASSERT_TRUE(set(tree, "/id:3", ""));
  ASSERT_TRUE(set(tree, "/a/b", "x"));
  ASSERT_TRUE(set(tree, "/c", ""));
  ASSERT_TRUE(set(tree, "/c/d", ""));
  ASSERT_TRUE(read_settings(dump(tree), copy, error)) << error;
  EXPECT_TRUE(exists(copy, "/id:1"));
  EXPECT_EQ(get(copy, "/id:2"), std::nullopt);
  EXPECT_EQ(get(copy, "/id:3"), "");
  EXPECT_EQ(get(copy, "/a"), std::nullopt);
  EXPECT_EQ(get(copy, "/c"), "");
  EXPECT_EQ(get(copy, "/c/d"), "");
  EXPECT_EQ(dump(copy), dump(tree));
}

TEST(Dump, GivesEveryByteBack) {
  for (int byte = 1; byte < 256; byte++) {
    const std::string alone(1, static_cast<char>(byte));
    for (const std::string& value : {alone, "x" + alone, alone + "x", alone + alone, "x" + alone + "y"}) {
      EXPECT_EQ(round_trip(value, false), value) << "byte " << byte;
      EXPECT_EQ(round_trip(value, true), value) << "byte " << byte;
    }
  }
}

TEST(Dump, GivesAwkwardValuesBack) {
  const std::string values[] = {
      "",
      " ",
      "\n",
      "\t\n ",
      " x",
      "x ",
      "x\n",
      "\r\n",
      "a\r\nb",
      "]]>",
      "<![CDATA[x]]>",
      "&amp;",
      "&#13;",
      "<config>",
      "\"'",
      "YQ==",
      "\xEF\xBB\xBF",
      "\xEF\xBF\xBD",
      "\xEF\xBF\xBE",
      "\xEF\xBF\xBF",
      "\xED\xA0\x80",
      "\xC0\x80",
      "\xE0\x80\xAF",
      "\xF0\x8F\xBF\xBF",
      "\xF4\x8F\xBF\xBF",
      "\xF4\x90\x80\x80",
      "\xF0\x9F\x98\x80",
      "\xC2\x85",
      "\xE2\x80\xA8",
      "\xC3",
      "\xE2\x82",
      "\xF0\x9F\x98",
      std::string(65535, 'x'),
      std::string(65535, '&'),
      std::string(65535, '\n'),
      std::string(65535, '\x01'),
      std::string(65534, ' ') + "x",
      "x" + std::string(65534, ' '),
      "x" + std::string(65533, ' ') + "y",
  };
  for (const std::string& value : values) {
    EXPECT_EQ(round_trip(value, false), value);
    EXPECT_EQ(round_trip(value, true), value);
  }
}

TEST(Dump, GoesAsDeepAsAPath) {
  Tree tree;
  std::string path;
  for (int i = 0; i < 511; i++) path += "/a";
  ASSERT_TRUE(set(tree, path, "deep"));
  EXPECT_EQ(loaded(dump(tree)), path + "=deep\n");
}

TEST(Load, TakesAFileOfAnotherProgram) {
  EXPECT_EQ(loaded("<config><a>1</a><b><c>2</c><c>3</c></b></config>"), "/a=1\n/b/c=2\n/b/c:2=3\n");
  EXPECT_EQ(
      loaded(
          "<?xml version='1.0' standalone='yes'?>\r\n<!-- by hand -->\r\n<config version=\"2\">\r\n\t<a>\r\n"
          "\t\t<id>\r\n\t\t\t<target>x</target>\r\n\t\t</id>\r\n\t</a>\r\n</config>\r\n<!-- end -->\r\n"),
      "/a/id:1/target=x\n");
  EXPECT_EQ(loaded("<config><a> kept </a></config>"), "/a= kept \n");
  EXPECT_EQ(loaded("<config><a>one<!-- -->two<![CDATA[<&>]]>&#65;&quot;&apos;</a></config>"),
            "/a=onetwo<&>A\"'\n");
  EXPECT_EQ(loaded("<config/>"), "");
  EXPECT_EQ(loaded("<!DOCTYPE config><config><a>1</a></config>"), "/a=1\n");
}

TEST(Load, WhiteSpaceAloneIsTheEmptyValue) {
  EXPECT_EQ(loaded("<config><a/><b></b><c> \n\t</c></config>"), "/a=\n/b=\n/c=\n");
  EXPECT_EQ(loaded("<config><a>" + std::string(100000, '\n') + "</a></config>"), "/a=\n");
}

TEST(Load, WhiteSpaceBetweenElementsMeansNothing) {
  const std::string gap(100000, ' ');
  EXPECT_EQ(loaded("<config>" + gap + "<a>" + gap + "<b>1</b>" + gap + "</a>" + gap + "</config>"),
            "/a/b=1\n");
  EXPECT_EQ(loaded("<config><a>v" + gap + "<b>1</b>" + gap + "</a></config>"), "/a=v\n/a/b=1\n");
  EXPECT_EQ(loaded("<config><a><b>1</b>" + gap + "v</a></config>"), "/a=v\n/a/b=1\n");
  EXPECT_EQ(loaded("<config><a> x <b/> y </a></config>"), "/a=x  y\n/a/b=\n");
}

TEST(Load, TakesOtherEncodings) {
  EXPECT_EQ(loaded("<?xml version='1.0' encoding='ISO-8859-1'?><config><a>\xE4</a></config>"),
            "/a=\xC3\xA4\n");
}

TEST(Load, Base64MayBeLaidOut) {
  EXPECT_EQ(loaded("<config><a encoding='base64'>\n  YW\n  Jj\n</a></config>"), "/a=abc\n");
  EXPECT_EQ(loaded("<config><a encoding='base64'> <b/> IHg= </a></config>"), "/a= x\n/a/b=\n");
  EXPECT_EQ(loaded("<config><a encoding='base64'/></config>"), "/a=\n");
}

struct Damaged {
  const char* document;
  const char* error;
};

class DamagedFile : public testing::TestWithParam<Damaged> {};

TEST_P(DamagedFile, IsRefusedWithItsLine) {
  EXPECT_EQ(loaded(GetParam().document), GetParam().error) << GetParam().document;
}

INSTANTIATE_TEST_SUITE_P(
    Load, DamagedFile,
    testing::Values(
        Damaged{"", "line 1: no element found"}, Damaged{"   \n\n", "line 3: no element found"},
        Damaged{"not xml", "line 1: syntax error"},
        Damaged{"<config>\n<a>1</a>\n", "line 3: no element found"},
        Damaged{"<config>\n<a>1</a", "line 2: unclosed token"},
        Damaged{"<config>\n<a></b>\n</config>", "line 2: mismatched tag"},
        Damaged{"<config/>\nx", "line 2: junk after document element"},
        Damaged{"<config/>\n<config/>", "line 2: junk after document element"},
        Damaged{"<settings/>", "line 1: the root element is not config"},
        Damaged{"<Config/>", "line 1: the root element is not config"},
        Damaged{"<config>\ntext</config>", "line 2: text outside every node"},
        Damaged{"<config>\n\n<\xC3\xA4>1</\xC3\xA4>\n</config>", "line 3: a name that is not allowed"},
        Damaged{"<config>\n<id:3>1</id:3>\n</config>", "line 2: a name that is not allowed"},
        Damaged{"<config>\n<1a>1</1a>\n</config>", "line 2: not well-formed (invalid token)"},
        Damaged{"<config><a>&#1;</a></config>", "line 1: reference to invalid character number"},
        Damaged{"<config><a>&#0;</a></config>", "line 1: reference to invalid character number"},
        Damaged{"<config><a>\x01</a></config>", "line 1: not well-formed (invalid token)"},
        Damaged{"<config><a>\xFF</a></config>", "line 1: not well-formed (invalid token)"},
        Damaged{"<config><a>&nix;</a></config>", "line 1: undefined entity"},
        Damaged{"<!DOCTYPE config [\n<!ENTITY e \"x\">]>\n<config><a>&e;</a></config>",
                "line 1: a document type declaration"},
        Damaged{"<!DOCTYPE config SYSTEM \"/etc/passwd\">\n<config/>", "line 1: a document type declaration"},
        Damaged{"<config>\n<a encoding=\"hex\">61</a></config>", "line 2: an encoding that is not base64"},
        Damaged{"<config>\n<a\nencoding=\"base64\">\nY</a></config>", "line 4: text that is not base64"},
        Damaged{"<config><a encoding=\"base64\">YQ=</a></config>", "line 1: text that is not base64"},
        Damaged{"<config><a encoding=\"base64\">YR==</a></config>", "line 1: text that is not base64"},
        Damaged{"<config><a encoding=\"base64\">YQ==YQ==</a></config>", "line 1: text that is not base64"},
        Damaged{"<config><a encoding=\"base64\">YQ?=</a></config>", "line 1: text that is not base64"},
        Damaged{"<config><a encoding=\"base64\">====</a></config>", "line 1: text that is not base64"},
        Damaged{"<config><a encoding=\"base64\">YQBi</a></config>", "line 1: a value with a NUL byte"},
        Damaged{"<config><a value=\"some\"/></config>", "line 1: a value attribute that is not none"},
        Damaged{"<config><a value=\"none\">x</a></config>",
                "line 1: a value in a node marked to have none"}));

TEST(Load, RefusesMoreThan4096ElementsOfOneName) {
  std::string document = "<config>\n";
  for (int i = 0; i < 4096; i++) document += "<id/>\n";
  Tree tree;
  std::string error;
  EXPECT_TRUE(read_settings(document + "</config>", tree, error)) << error;
  EXPECT_EQ(loaded(document + "<id/>\n</config>").substr(0, 15), "line 4098: more");
}

TEST(Load, RefusesAValueThatIsTooLong) {
  const std::string x(65535, 'x');
  const char* error = "line 2: a value of more than 65535 bytes";
  EXPECT_EQ(loaded("<config><a>" + x + "</a></config>"), "/a=" + x + "\n");
  EXPECT_EQ(loaded("<config>\n<a>" + x + "x</a></config>"), error);
  EXPECT_EQ(loaded("<config>\n<a>" + x + " </a></config>"), error);
  EXPECT_EQ(loaded("<config>\n<a> " + x + "</a></config>"), error);
  EXPECT_EQ(loaded("<config>\n<a> " + x + "<b/></a></config>"), error);
  EXPECT_EQ(loaded("<config>\n<a>x" + std::string(65535, ' ') + "<b/>y</a></config>"), error);
  EXPECT_EQ(loaded("<config><a>" + x + " <b/> </a></config>"), "/a=" + x + "\n/a/b=\n");
  EXPECT_EQ(loaded("<config>\n<a encoding='base64'>" + std::string(87384, 'A') + "</a></config>"), error);
}

TEST(Load, RefusesAPathThatIsTooLong) {
  const std::string name(1000, 'n');
  EXPECT_EQ(loaded("<config><" + name + "><b>1</b></" + name + "></config>"), "/" + name + "/b=1\n");
  const std::string longer(1022, 'n');
  EXPECT_EQ(loaded("<config>\n<" + longer + ">1</" + longer + "></config>"), "/" + longer + "=1\n");
  EXPECT_EQ(loaded("<config>\n<" + longer + "n/></config>"), "line 2: a path of more than 1023 bytes");
  EXPECT_EQ(loaded("<config>\n<" + longer + "/>\n<" + longer + "/></config>"),
            "line 3: a path of more than 1023 bytes");
}

TEST(Load, RefusesAbsurdDepth) {
  std::string document = "<config>";
  for (int i = 0; i < 1000000; i++) document += "<a>";
  EXPECT_EQ(loaded(document), "line 1: a path of more than 1023 bytes");
}

TEST(Load, RefusesATreeThatIsTooLarge) {
  std::string nodes = "<config>";
  for (int i = 0; i < 70; i++) {
    nodes += "<a>";
    for (int k = 0; k < 4096; k++) nodes += "<b/>";
    nodes += "</a>";
  }
  EXPECT_NE(loaded(nodes + "</config>").find("too large"), std::string::npos);
}

TEST(Load, RefusesATokenWithoutEnd) {
  EXPECT_EQ(loaded("<config><!--" + std::string(3 << 20, 'x')), "line 1: a document that is too long");
  EXPECT_EQ(loaded("<config><" + std::string(3 << 20, 'x')), "line 1: a document that is too long");
}

TEST(Load, EveryCutFileIsRefused) {
  Tree tree;
  ASSERT_TRUE(set(tree, "/iscsi/initiator/id:2/target", "\x01<&"));
  ASSERT_TRUE(set(tree, "/iscsi/initiator", " v"));
  const std::string whole = dump(tree);
  const size_t last = whole.find("</config>") + 9;
  for (size_t size = 0; size < last; size++) {
    EXPECT_EQ(loaded(whole.substr(0, size)).substr(0, 5), "line ") << size;
  }
  EXPECT_EQ(loaded(whole.substr(0, last)), list(tree));
}

TEST(Base64, EncodesAsTheStandardSays) {
  const std::pair<const char*, const char*> samples[] = {
      {"", ""}, {"f", "Zg=="}, {"fo", "Zm8="}, {"foo", "Zm9v"}, {"foob", "Zm9vYg=="}, {"foobar", "Zm9vYmFy"}};
  for (const auto& [plain, encoded] : samples) {
    std::string text;
    encode_base64(plain, [&](char c) { text += c; });
    EXPECT_EQ(text, encoded);
    std::string bytes;
    EXPECT_TRUE(decode_base64(encoded, bytes));
    EXPECT_EQ(bytes, plain);
  }
}

}  // namespace
}  // namespace ktree
