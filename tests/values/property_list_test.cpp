#include "values/property_list.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <ctime>
#include <limits>
#include <vector>

#include "values/text.h"

namespace quorlet {
namespace {

constexpr double kInfinity = std::numeric_limits<double>::infinity();

std::string Xml(std::string_view body) { return FormatText("<plist>%s</plist>", body); }

// A binary document of these objects; the first is the root, references have one byte.
std::string Binary(const std::vector<std::string>& objects) {
  std::string out = "bplist00";
  std::string offsets;
  for (const std::string& object : objects) {
    offsets += {static_cast<char>(out.size() >> 8), static_cast<char>(out.size())};
    out += object;
  }
  const std::size_t table = out.size();
  std::string trailer(32, '\0');
  trailer[6] = 2;
  trailer[7] = 1;
  trailer[15] = static_cast<char>(objects.size());
  trailer[30] = static_cast<char>(table >> 8);
  trailer[31] = static_cast<char>(table);
  return out + offsets + trailer;
}

std::string Bytes(std::initializer_list<int> bytes) {
  std::string out;
  for (const int byte : bytes) out += static_cast<char>(byte);
  return out;
}

std::string Nested(std::size_t depth) {
  std::string open;
  std::string close;
  for (std::size_t i = 0; i < depth; ++i) {
    open += "<array>";
    close += "</array>";
  }
  return Xml(open + close);
}

// `levels` arrays, each of which holds the next one eight times; the last one holds `leaf`.
std::string SharedArrays(int levels, const std::string& leaf) {
  std::vector<std::string> objects;
  for (int i = 1; i <= levels; ++i) objects.push_back(Bytes({0xA8, i, i, i, i, i, i, i, i}));
  objects.push_back(leaf);
  return Binary(objects);
}

testing::AssertionResult Reads(const std::string& document, const PropertyValue& expected) {
  const auto result = ReadPropertyList(document);
  if (const auto* error = std::get_if<PropertyListError>(&result)) {
    return testing::AssertionFailure() << document << "\n" << error->description;
  }
  const auto& value = std::get<PropertyValue>(result);
  if (value == expected) return testing::AssertionSuccess();
  return testing::AssertionFailure() << document << "\ngives " << value.description();
}

std::string ErrorOf(const std::string& document) {
  const auto result = ReadPropertyList(document);
  const auto* error = std::get_if<PropertyListError>(&result);
  return error == nullptr ? "none" : error->description;
}

std::string Written(const PropertyValue& value) {
  const auto result = WriteXmlPropertyList(value);
  const auto* error = std::get_if<PropertyListError>(&result);
  return error == nullptr ? std::get<std::string>(result)
                          : FormatText("error: %s", error->description);
}

TEST(XmlReader, RefusesBadDocumentsAndSaysWhy) {
  const std::pair<std::string, std::string_view> cases[] = {
      {"", "the document is empty"},
      {"<plist>\n<true/>", "line 2: the document ends inside <plist>"},
      {Xml("<array>\n</dict></array>"), "line 2: </dict> inside <array>"},
      {Xml("<dict><key>a</key></dict>"), "line 1: the last <key> of <dict> has no value"},
      {Xml("<string>&#xD800;</string>"), "line 1: \"&#xD800;\" names no character"},
      {Xml("<string>\x01</string>"), "line 1: a character that XML cannot hold"},
      {Xml("<string>\n\xFF</string>"), "line 2: not valid UTF-8"},
      {"<?xml version='1.0' encoding='latin1'?>" + Xml("<true/>"),
       "line 1: the document is not in UTF-8"},
      {Nested(200'000), "line 1: nested more than 128 deep"},
      {std::string(kMaxPropertyListBytes + 1, ' '), "the document is larger than 16777216 bytes"},
  };
  for (const auto& [document, error] : cases) {
    EXPECT_EQ(ErrorOf(document), error) << document.substr(0, 100);
  }
  for (const char* scalar :
       {"integer></", "integer>abc</", "integer>0x</", "integer>1 2</",
        "integer>18446744073709551616</", "integer>-9223372036854775809</", "real></", "real>1e</",
        "real>0x1p3</", "real>1e999</", "data>A</", "data>AQI</", "data>A===</", "data>AQ=I</",
        "date></", "date>2026-02-29T00:00:00Z</", "date>2026-01-01T24:00:00Z</",
        "date>0-01-01T00:00:00Z</"}) {
    const std::string name(scalar, std::string_view(scalar).find('>') + 1);
    EXPECT_NE(ErrorOf(Xml("<" + std::string(scalar) + name)), "none") << scalar;
  }
}

// {"k": [...]} with every kind of object.
const std::string kGoodBinary = Binary(
    {Bytes({0xD1, 1, 2}), "Qk", Bytes({0xAA, 3, 4, 5, 6, 7, 8, 9, 10, 11, 4}), Bytes({0x10, 0xFF}),
     Bytes({0x08}), Bytes({0x13, 255, 255, 255, 255, 255, 255, 255, 254}),
     Bytes({0x14, 0, 0, 0, 0, 0, 0, 0, 0, 255, 255, 255, 255, 255, 255, 255, 255}),
     Bytes({0x23, 0x3F, 0xF8, 0, 0, 0, 0, 0, 0}), Bytes({0x33, 0x3F, 0xE0, 0, 0, 0, 0, 0, 0}),
     Bytes({0x42, 1, 2}), Bytes({0x63, 0x20, 0xAC, 0xD8, 0x3D, 0xDE, 0x00}),
     Bytes({0x5F, 0x10, 1, 'x'})});

TEST(BinaryReader, ReadsGoodDocuments) {
  EXPECT_TRUE(
      Reads(kGoodBinary,
            Dictionary{{"k", Array{Int32(255), false, Int32(-2),
                                   UInt64(std::numeric_limits<std::uint64_t>::max()), Double(1.5),
                                   Date{978307200.5}, Data{std::byte{1}, std::byte{2}},
                                   "\u20AC\U0001F600", "x", false}}}));
}

TEST(BinaryReader, RefusesBadDocumentsAndSaysWhy) {
  const auto withTrailer = [](std::size_t at, int byte) {
    std::string document = Binary({Bytes({0x08})});
    document[document.size() - 32 + at] = static_cast<char>(byte);
    return document;
  };
  std::vector<std::string> chain;
  for (int i = 1; i <= 128; ++i) chain.push_back(Bytes({0xA1, i}));
  chain.push_back(Bytes({0xA0}));
  // The root holds the chain's lower half first, so that it is known when the upper one meets it.
  std::vector<std::string> known = chain;
  known[0] = Bytes({0xA2, 100, 1});
  const std::pair<std::string, std::string_view> cases[] = {
      {"bplist00", "the document is too short"},
      {withTrailer(6, 0), "the trailer holds impossible sizes"},
      {withTrailer(8, 1), "more than 1000000 objects"},
      {withTrailer(24, 0xFF), "the offset table lies outside of the document"},
      {withTrailer(31, 8), "object 0 lies outside of the document"},
      {Binary({Bytes({0xA1, 1}), Bytes({0xD1, 2, 0}), "Qk"}), "object 0 contains itself"},
      {Binary({Bytes({0xA1, 9})}), "object 0 refers to an object that does not exist"},
      {Binary({Bytes({0xD1, 1, 1}), Bytes({0x09})}), "object 0 has a key that is not a string"},
      {Binary({Bytes({0x14, 0, 0, 0, 0, 0, 0, 0, 1, 0, 0, 0, 0, 0, 0, 0, 0})}),
       "object 0 is an integer beyond 64 bits"},
      {Binary({Bytes({0x53, 'a', 'b'})}), "object 0 does not end inside the document"},
      {Binary({Bytes({0x4F, 0x13, 255, 255, 255, 255, 255, 255, 255, 255})}),
       "object 0 does not end inside the document"},
      {Binary({Bytes({0xAF, 0x23, 0, 0})}), "object 0 has no count"},
      {Binary({Bytes({0x52, 'a', 0})}), "object 0 is a string with a null character"},
      {Binary(chain), "object 128 is nested more than 128 deep"},
      {Binary(known), "object 100 is nested more than 128 deep"},
      {SharedArrays(40, Bytes({0x08})), "more than 1000000 values"},
      {SharedArrays(6, Bytes({0x4F, 0x11, 4, 1}) + std::string(1025, 'x')),
       "more than 67108864 bytes of content"},
  };
  for (const auto& [document, error] : cases) EXPECT_EQ(ErrorOf(document), error);
}

TEST(Reader, SurvivesEveryCutAndEveryChangedByte) {
  const std::string xml =
      "<?xml version=\"1.0\"?><plist><dict><key>a</key><string>x&amp;</string><key>b</key><array>"
      "<integer>-5</integer><data>AQI=</data><date>2026-03-04T05:06:07Z</date></array></dict></"
      "plist>";
  ASSERT_EQ(ErrorOf(xml), "none");
  for (const std::string& good : {xml, kGoodBinary}) {
    for (std::size_t length = 0; length < good.size(); ++length) {
      EXPECT_NE(ErrorOf(good.substr(0, length)), "none") << length;
    }
    for (std::size_t i = 0; i < good.size(); ++i) {
      for (const int mask : {0x01, 0x10, 0x80, 0xFF}) {
        std::string changed = good;
        changed[i] = static_cast<char>(changed[i] ^ mask);
        const auto result = ReadPropertyList(changed);
        if (const auto* value = std::get_if<PropertyValue>(&result)) {
          EXPECT_EQ(ErrorOf(Written(*value)), "none") << i;
        }
      }
    }
  }
}

TEST(Writer, ValuesSurviveARoundTrip) {
  using Signed = std::numeric_limits<std::int64_t>;
  const PropertyValue cases[] = {
      Array{true, false, "", Array{}, Dictionary{}, Data{}, Data(100, std::byte{0xFB})},
      Array{Int8(-1), Int16(-2), Int32(-3), Int64(Signed::max()), Int64(Signed::min())},
      Array{UInt64(5), UInt64(std::uint64_t{1} << 63), UInt64(~std::uint64_t{0})},
      Array{Double(0.1), Double(5e-324), Double(1.7976931348623157e308), Double(kInfinity),
            Double(-kInfinity), Double(1e21), Single(0.1F), Double(-1.0 / 3)},
      // 1900, 1932, 1969, 2001, 2026, 2069, 2100, year 1 and year 9999.
      Array{Date{-2208988800}, Date{-1169176449}, Date{-1}, Date{978307200}, Date{1772600767},
            Date{3125790847}, Date{3125790848}, Date{4102444800}, Date{-62135596800},
            Date{253402300799}},
      Array{Double(-0.0), Array{Array{Dictionary{{"k", Data(57, std::byte{1})}}}}},
      Dictionary{{"", "<&]]>\"']]> \t\n\r \U0001F600 "}, {"a&b<c>", Dictionary{{" k ", "  "}}}},
  };
  for (const PropertyValue& value : cases) EXPECT_TRUE(Reads(Written(value), value));
  const auto nan = ReadPropertyList(Written(Double(NAN)));
  EXPECT_TRUE(std::isnan(std::get<PropertyValue>(nan).asNumber()->toDouble()));
}

TEST(Writer, WritesOnlyWhatXmlHolds) {
  const std::string all("a\0\x01\x1F\x7F\xFF\xEF\xBF\xBEz", 10);
  const std::string_view repaired = "a\uFFFD\uFFFD\uFFFD\x7F\uFFFD\uFFFDz";
  EXPECT_TRUE(Reads(Written(Dictionary{{all, all}}), Dictionary{{repaired, repaired}}));
  EXPECT_TRUE(
      Reads(Written(Array{Date{1.75}, Date{-0.5}, Date{NAN}, Date{kInfinity}, Date{-1e300}}),
            Array{Date{1}, Date{-1}, Date{0}, Date{253402300799}, Date{-62135596800}}));
}

TEST(Writer, RefusesWhatIsTooDeepOrTooLarge) {
  PropertyValue deep = Array{};
  for (std::size_t i = 1; i < kMaxPropertyListDepth; ++i) deep = Array{deep};
  EXPECT_TRUE(Reads(Written(deep), deep));
  EXPECT_EQ(Written(Array{deep}), "error: the tree is nested more than 128 deep");

  Array wide;
  for (int i = 0; i < 1'000'000; ++i) wide.push_back(true);
  EXPECT_EQ(Written(wide), "error: more than 1000000 values");
  PropertyValue doubling = Array{"x"};
  for (int i = 0; i < 30; ++i) doubling = Array{doubling, doubling};
  EXPECT_EQ(Written(doubling), "error: the document is larger than 16777216 bytes");
  EXPECT_EQ(Written(std::string(kMaxPropertyListBytes, 'x')),
            "error: the document is larger than 16777216 bytes");
  const PropertyValue log = std::string(kMaxPropertyListBytes, '&');
  EXPECT_EQ(std::get<PropertyListError>(WriteXmlPropertyList(log, kLogLimits)).description,
            "the document is larger than 67108864 bytes");
}

}  // namespace
}  // namespace quorlet
