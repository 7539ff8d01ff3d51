#include "platform/PropertyList.h"

#include <gtest/gtest.h>
#include <locale.h>
#include <plist/plist.h>
#include <stdlib.h>

#include <cerrno>
#include <cstdlib>
#include <limits>
#include <string>
#include <vector>

#include "tests/platform/system/Expect.h"
#include "tests/support/ScratchFolder.h"

namespace telvane::propertylist {
namespace {

using telvane::testing::failsWith;
using telvane::testing::holds;
using telvane::testing::succeeds;

Value everyKind() {
  return Dictionary{{"true", true},
                    {"false", false},
                    {"zero", 0},
                    {"one", 1},
                    {"negative", -1},
                    {"lowest", std::numeric_limits<int64_t>::min()},
                    {"highest", std::numeric_limits<int64_t>::max()},
                    {"unsigned", std::numeric_limits<uint64_t>::max()},
                    {"whole real", 1.0},
                    {"real", 0.1 + 0.2},
                    {"large", 1.7976931348623157e308},
                    {"small", -5e-324},
                    {"text", "a <b> & \"c\" grün €"},
                    {"no text", ""},
                    {"data", Data::copyOf(std::string_view("\0\1\xFF", 3))},
                    {"no data", Data()},
                    {"date", Date::fromSecondsSince1970(1714570000)},
                    {"old date", Date::fromSecondsSince1970(-62135596800.0)},
                    {"array", Array{1, "two", Array{}, Dictionary{}}},
                    {"dictionary", Dictionary{{"key with <mark>", Array{true}}}}};
}

Result<Value> parsed(std::string_view text, const Limits& limits = {}) { return parse(Data::copyOf(text), limits); }

std::string xml(const std::string& content) { return "<plist version=\"1.0\">" + content + "</plist>"; }

Value nested(size_t levels) {
  Value value(1);
  for (size_t i = 1; i < levels; ++i) value = Array{value};
  return value;
}

std::string repeated(const std::string& text, size_t count) {
  std::string result;
  for (size_t i = 0; i < count; ++i) result += text;
  return result;
}

// A binary list of these objects, of which the first is the root; references are of one byte.
std::string binary(const std::vector<std::string>& objects) {
  std::string bytes = "bplist00";
  std::string table;
  for (const std::string& object : objects) {
    table += {static_cast<char>(bytes.size() >> 8), static_cast<char>(bytes.size())};
    bytes += object;
  }
  const size_t tableOffset = bytes.size();
  bytes += table + std::string(6, '\0') + "\x02\x01";
  for (const size_t number : {objects.size(), size_t{0}, tableOffset}) {
    for (int shift = 56; shift >= 0; shift -= 8) bytes += static_cast<char>(number >> shift & 0xFF);
  }
  return bytes;
}

std::string bytes(std::initializer_list<int> numbers) {
  std::string result;
  for (const int number : numbers) result += static_cast<char>(number);
  return result;
}

TEST(PropertyListTest, keepsKindsAndContentsThroughBothForms) {
  for (const Format format : {Format::XML, Format::Binary}) {
    const Result<Data> data = serialize(everyKind(), format);
    ASSERT_TRUE(succeeds(data));
    EXPECT_TRUE(holds(parse(*data), everyKind()));
  }
}

TEST(PropertyListTest, writesTheTwoForms) {
  EXPECT_TRUE(serialize(1, Format::Binary)->view().starts_with("bplist00"));
  const Result<Data> text = serialize(Dictionary{{"a", 1}}, Format::XML);
  EXPECT_NE(text->view().find("<key>a</key>\n\t<integer>1</integer>"), std::string_view::npos) << text->view();
}

TEST(PropertyListTest, keepsMicrosecondsInTheBinaryForm) {
  const Date date(Date::TimePoint(std::chrono::microseconds(1714570000123456)));
  EXPECT_TRUE(holds(parse(*serialize(date, Format::Binary)), date));
}

TEST(PropertyListTest, writesAndReadsNumbersAlikeInEveryLanguage) {
  const testing::ScratchFolder folder;
  const std::string command = "localedef -i de_DE -f UTF-8 " + folder.at("comma") + " >/dev/null 2>&1";
  if (std::system(command.c_str()) != 0) GTEST_SKIP() << "no language with a decimal comma can be made here";
  ::setenv("LOCPATH", folder.path().c_str(), 1);
  ASSERT_NE(::setlocale(LC_NUMERIC, "comma"), nullptr);
  const std::string text(serialize(2.5, Format::XML)->view());
  const Result<Value> read = parsed(text);
  const std::string point = ::localeconv()->decimal_point;
  ::setlocale(LC_NUMERIC, "C");
  ::unsetenv("LOCPATH");
  EXPECT_NE(text.find("<real>2.5</real>"), std::string::npos) << text;
  EXPECT_TRUE(holds(read, 2.5));
  EXPECT_EQ(point, ",") << "the choice of the program around must stay";
}

TEST(PropertyListTest, replacesInvalidText) {
  EXPECT_TRUE(holds(parse(*serialize(Value("a\xFF"), Format::Binary)), Value("a\xEF\xBF\xBD")));
}

TEST(PropertyListTest, refusesToWriteWhatTheFormsCannotHold) {
  Array withAbsent;
  withAbsent.append(Value());
  Dictionary withNullInKey;
  withNullInKey.set(String(std::string_view("a\0b", 3)), 1);
  for (const Value& value :
       {Value(), Value(withAbsent), Value(std::string_view("a\0b", 3)), Value(withNullInKey), nested(65)}) {
    EXPECT_TRUE(failsWith(serialize(value, Format::XML), EINVAL)) << description(value);
    EXPECT_TRUE(failsWith(serialize(value, Format::Binary), EINVAL)) << description(value);
  }
}

TEST(PropertyListTest, readsAndWritesSixtyFourLevels) {
  for (const Format format : {Format::XML, Format::Binary}) {
    EXPECT_TRUE(holds(parse(*serialize(nested(64), format)), nested(64)));
    EXPECT_TRUE(failsWith(parse(*serialize(nested(64), format), {.maximumDepth = 63}), ELOOP));
  }
}

TEST(PropertyListTest, readsXMLAsPeopleWriteIt) {
  EXPECT_TRUE(holds(parsed("\xEF\xBB\xBF\n<?xml version=\"1.0\"?><!DOCTYPE plist PUBLIC \"x\" \"y\">\n<!-- a -->" +
                           xml("<!-- </array> --><dict>\n <key>a</key> <string>x<!-- y -->z</string><key>b</key>"
                               "<string><![CDATA[</string>]]></string></dict>") +
                           "\n<!-- end -->\n"),
                    Dictionary{{"a", "xz"}, {"b", "</string>"}}));
  EXPECT_TRUE(holds(parsed(xml("<array><true/><integer>-7</integer><integer>0x1F</integer><string/><dict/></array>")),
                    Array{true, -7, 31, "", Dictionary()}));
}

TEST(PropertyListTest, refusesOtherFormsAndGarbage) {
  for (const char* text : {"", " ", "{\"a\": 1}", "{ a = 1; }", "(1, 2)", "hello", "bplist", "bplist00",
                           "bplist15xxxxxxxx", "<", "<html></html>", "<?xml version=\"1.0\"?>"}) {
    EXPECT_TRUE(failsWith(parsed(text), EINVAL)) << text;
  }
}

TEST(PropertyListTest, refusesMalformedXML) {
  for (const char* content :
       {"", "<dict>", "<dict></array>", "<array><dict></array></dict>", "<true/><true/>", "<foo/>", "text",
        "<key>a</key>", "<dict><key>a</key></dict>", "<dict><string>a</string><true/></dict>",
        "<dict><key>a</key><key>b</key></dict>", "<array><key>a</key></array>", "<string>a", "<string>a<b/></string>",
        "<string a=\"b\">x</string>", "<array><!-- </array>", "<string><![CDATA[x</string>",
        "<plist><true/></plist>"}) {
    EXPECT_TRUE(failsWith(parsed(xml(content)), EINVAL)) << content;
  }
  EXPECT_TRUE(failsWith(parsed("<dict/>"), EINVAL));
  EXPECT_TRUE(failsWith(parsed("<plist/>"), EINVAL));
  EXPECT_TRUE(failsWith(parsed(std::string_view("<plist><true/>\0</plist>", 23)), EINVAL));
  EXPECT_TRUE(failsWith(parsed("<!DOCTYPE plist [<!ENTITY a \"b\">]>" + xml("<string>&a;</string>")), EINVAL));
}

TEST(PropertyListTest, refusesWhatFollowsTheEnd) {
  EXPECT_TRUE(failsWith(parsed(xml("<true/>") + "x"), EINVAL));
  EXPECT_TRUE(failsWith(parsed(xml("<true/>") + xml("<true/>")), EINVAL));
  EXPECT_TRUE(failsWith(parsed(std::string(serialize(1, Format::Binary)->view()) + "x"), EINVAL));
}

TEST(PropertyListTest, refusesXMLThatIsNestedDeepWithoutFollowingIt) {
  EXPECT_TRUE(failsWith(parsed(xml(repeated("<array>", 500000))), ELOOP));
  EXPECT_TRUE(failsWith(parsed(xml(repeated("<dict><key>a</key>", 500000))), ELOOP));
  EXPECT_TRUE(failsWith(parsed(xml(repeated("<array>", 65) + repeated("</array>", 65))), ELOOP));
  EXPECT_TRUE(failsWith(parsed(xml(repeated("<array>", 64) + "<true/>" + repeated("</array>", 64))), ELOOP));
  // Ends hidden in comments must not count.
  EXPECT_TRUE(failsWith(parsed(xml(repeated("<array><!-- </array> -->", 1000))), ELOOP));
}

TEST(PropertyListTest, boundsSizeAndNumber) {
  EXPECT_TRUE(failsWith(parsed(xml("<true/>"), {.maximumBytes = 10}), EFBIG));
  EXPECT_TRUE(failsWith(parsed(xml("<array>" + repeated("<true/>", 100) + "</array>"), {.maximumNodes = 100}), EFBIG));
  EXPECT_TRUE(failsWith(parse(*serialize(Array{1, 2, 3}, Format::Binary), {.maximumNodes = 3}), EFBIG));
}

TEST(PropertyListTest, refusesABinaryListThatContainsItself) {
  EXPECT_TRUE(failsWith(parsed(binary({bytes({0xA1, 0})})), EINVAL));
  EXPECT_TRUE(failsWith(parsed(binary({bytes({0xA1, 1}), bytes({0xA1, 0})})), EINVAL));
  EXPECT_TRUE(failsWith(parsed(binary({bytes({0xD1, 1, 0}),
                                       "\x51"
                                       "a"})),
                        EINVAL));
}

// Thirty arrays that each hold the next one ten times come to 10^30 values.
TEST(PropertyListTest, refusesABinaryListOfSharedObjectsThatExplodes) {
  std::vector<std::string> objects;
  for (int i = 1; i <= 30; ++i) objects.push_back(bytes({0xAA, i, i, i, i, i, i, i, i, i, i}));
  objects.push_back(
      "\x51"
      "a");
  EXPECT_TRUE(failsWith(parsed(binary(objects)), EFBIG));
}

TEST(PropertyListTest, refusesSharedDataThatExplodes) {
  // 100 x 100 references to 10,000 bytes are 100 MB.
  std::string tenThousand = bytes({0x4F, 0x11, 0x27, 0x10}) + std::string(10000, 'x');
  std::vector<std::string> objects = {bytes({0xAF, 0x10, 100}) + std::string(100, '\1'),
                                      bytes({0xAF, 0x10, 100}) + std::string(100, '\2'), tenThousand};
  EXPECT_TRUE(failsWith(parsed(binary(objects)), EFBIG));
}

TEST(PropertyListTest, readsSharedObjectsOfAHonestList) {
  EXPECT_TRUE(
      holds(parsed(binary({bytes({0xA3, 1, 1, 2}), bytes({0x10, 7}), bytes({0xA1, 1})})), Array{7, 7, Array{7}}));
}

TEST(PropertyListTest, refusesABinaryListThatIsNestedDeep) {
  std::vector<std::string> objects;
  for (int i = 1; i <= 200; ++i) objects.push_back(bytes({0xA1, i}));
  objects.push_back(bytes({0x08}));
  EXPECT_TRUE(failsWith(parsed(binary(objects)), ELOOP));
}

TEST(PropertyListTest, refusesMalformedBinaryObjects) {
  EXPECT_TRUE(failsWith(parsed(binary({bytes({0xA1, 9})})), EINVAL)) << "a reference that leads outside";
  EXPECT_TRUE(failsWith(parsed(binary({bytes({0x5F, 0x13, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF})})), EINVAL));
  EXPECT_TRUE(failsWith(parsed(binary({bytes({0x5E, 'a'})})), EINVAL)) << "text that is cut short";
  EXPECT_TRUE(failsWith(parsed(binary({bytes({0x80, 1})})), EINVAL)) << "an archive's reference";
  EXPECT_TRUE(failsWith(parsed(binary({bytes({0x00})})), EINVAL)) << "a null";
  EXPECT_TRUE(failsWith(parsed(binary({bytes({0xD1, 1, 1}), bytes({0x10, 1})})), EINVAL)) << "a key that is no text";
  EXPECT_TRUE(failsWith(parsed(binary({bytes({0x53, 'a', 0, 'b'})})), EINVAL)) << "a null character";
  EXPECT_TRUE(failsWith(parsed(binary({bytes({0x61, 0, 0})})), EINVAL)) << "a null character in UTF-16";
  EXPECT_TRUE(failsWith(parsed(binary({bytes({0x14}) + std::string(16, '\x7F')})), EINVAL)) << "too large an integer";
}

// Every cut and every altered byte of a real list is read or refused, never followed out of it.
TEST(PropertyListTest, survivesEveryCutAndEveryAlteredByte) {
  for (const Format format : {Format::XML, Format::Binary}) {
    const std::string whole(serialize(everyKind(), format)->view());
    for (size_t size = 0; size + 1 < whole.size(); ++size) {
      EXPECT_FALSE(parsed(std::string_view(whole).substr(0, size)).has_value()) << "cut to " << size;
    }
    size_t refused = 0;
    for (size_t position = 0; position < whole.size(); ++position) {
      for (const int flip : {0x01, 0x80, 0xFF}) {
        std::string altered = whole;
        altered[position] = static_cast<char>(altered[position] ^ flip);
        refused += parsed(altered).has_value() ? 0 : 1;
      }
    }
    EXPECT_GT(refused, 0u);
  }
}

TEST(PropertyListTest, keepsKindsThroughTheLibrarysNodes) {
  void* node = newNode(everyKind());
  ASSERT_NE(node, nullptr);
  EXPECT_TRUE(holds(fromNode(node), everyKind()));
  plist_free(node);
}

TEST(PropertyListTest, leavesOutOfANodeWhatItCannotHold) {
  EXPECT_EQ(newNode(Value()), nullptr);
  Array array{1};
  array.append(Value());
  array.append(std::string_view("a\0b", 3));
  void* node = newNode(array);
  EXPECT_TRUE(holds(fromNode(node), Array{1, "a"}));
  plist_free(node);
}

TEST(PropertyListTest, refusesNodesThatAValueCannotHold) {
  plist_t node = plist_new_uid(1);
  EXPECT_TRUE(failsWith(fromNode(node), EINVAL));
  plist_free(node);
  EXPECT_TRUE(holds(fromNode(nullptr), Value()));
}

TEST(PropertyListTest, boundsTheDepthOfNodes) {
  plist_t node = plist_new_bool(1);
  for (int i = 0; i < 64; ++i) {
    plist_t outer = plist_new_array();
    plist_array_append_item(outer, node);
    node = outer;
  }
  EXPECT_TRUE(failsWith(fromNode(node), ELOOP));
  plist_free(node);
}

}  // namespace
}  // namespace telvane::propertylist
