#include "values/property_value.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>

namespace quorlet {
namespace {

constexpr auto kMin = std::numeric_limits<std::int64_t>::min();
constexpr auto kMax = std::numeric_limits<std::int64_t>::max();
constexpr auto kUMax = std::numeric_limits<std::uint64_t>::max();
constexpr double kInfinity = std::numeric_limits<double>::infinity();

TEST(Number, ComparesByExactValueAcrossKinds) {
  constexpr std::int64_t kOdd = (std::int64_t{1} << 53) + 1;  // no double holds it
  const std::tuple<PropertyValue, PropertyValue, bool> cases[] = {
      {Int8(5), Double(5), true},
      {Int64(5), UInt64(5), true},
      {Int16(-1), UInt64(kUMax), false},
      {Int64(kOdd), Double(static_cast<double>(kOdd)), false},
      {Int64(kOdd - 1), Double(static_cast<double>(kOdd)), true},
      {Int64(kMax), Double(std::ldexp(1, 63)), false},
      {UInt64(std::uint64_t{1} << 63), Double(std::ldexp(1, 63)), true},
      {Int64(kMin), Double(-std::ldexp(1, 63)), true},
      {UInt64(kUMax), Double(std::ldexp(1, 64)), false},
      {Int32(0), Double(0.5), false},
      {Int32(0), Double(-0.0), true},
      {Single(0.1F), Double(0.1), false},
      {Double(NAN), Double(NAN), false},
      {Int64(kMax), Double(kInfinity), false},
      {Int32(1), true, false},
      {"1", Int32(1), false},
  };
  for (const auto& [a, b, same] : cases) {
    EXPECT_EQ(a == b, same) << a.description() << " and " << b.description();
    EXPECT_EQ(b == a, same) << b.description() << " and " << a.description();
  }
}

TEST(Number, ConversionsTruncateAndSaturate) {
  struct Case {
    PropertyValue value;
    std::int64_t asSigned;
    std::uint64_t asUnsigned;
  };
  const Case cases[] = {
      {Int8(-5), -5, 0},
      {UInt64(kUMax), kMax, kUMax},
      {Double(2.9), 2, 2},
      {Double(-2.9), -2, 0},
      {Double(std::ldexp(1, 63)), kMax, std::uint64_t{1} << 63},
      {Double(-std::ldexp(1, 63)), kMin, 0},
      {Double(std::ldexp(1, 64)), kMax, kUMax},
      {Double(kInfinity), kMax, kUMax},
      {Double(-kInfinity), kMin, 0},
      {Double(NAN), 0, 0},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(c.value.asNumber()->toInt64(), c.asSigned) << c.value.description();
    EXPECT_EQ(c.value.asNumber()->toUInt64(), c.asUnsigned) << c.value.description();
  }
}

TEST(Containers, HandlesShareAndCopiesDoNot) {
  Dictionary inner{{"n", Int32(1)}};
  Array list{inner, "text"};
  const PropertyValue root = Dictionary{{"list", list}};
  const PropertyValue shallow = root.shallowCopy();
  const PropertyValue deep = root.deepCopy();
  EXPECT_EQ(root, deep);

  inner["n"] = Int32(2);
  list.push_back(true);
  EXPECT_EQ(root, (Dictionary{{"list", Array{Dictionary{{"n", Int32(2)}}, "text", true}}}));
  EXPECT_EQ(deep, (Dictionary{{"list", Array{Dictionary{{"n", Int32(1)}}, "text"}}}));
  EXPECT_EQ(root, shallow);
  EXPECT_FALSE(shallow.asDictionary()->sharesWith(*root.asDictionary()));
  EXPECT_TRUE(ArrayEntry(*shallow.asDictionary(), "list")->sharesWith(list));

  Dictionary entries{{"b", "x"}, {"a", Double(7.9)}, {"b", "y"}};
  EXPECT_EQ(*StringEntry(entries, "b"), "y");
  EXPECT_EQ(IntegerEntry(entries, "a"), 7);
  EXPECT_EQ(IntegerEntry(entries, "b"), std::nullopt);
  EXPECT_EQ(DataEntry(entries, "b"), nullptr);
  EXPECT_EQ(DictionaryEntry(entries, "missing"), nullptr);
  entries.remove("b");
  entries.remove("missing");
  EXPECT_EQ(entries["new"], PropertyValue(false));
  EXPECT_EQ(entries, (Dictionary{{"a", Double(7.9)}, {"new", false}}));
}

TEST(Description, PrintsEveryKind) {
  const std::pair<PropertyValue, std::string_view> cases[] = {
      {true, "1"},
      {"a \"b\"", "a \"b\""},
      {Int64(kMin), "-9223372036854775808"},
      {UInt64(kUMax), "18446744073709551615"},
      {Double(10), "10"},
      {Double(2.5), "2.5"},
      {Double(0.1), "0.1"},
      {Double(1e21), "1e+21"},
      {Double(-kInfinity), "-inf"},
      {Double(-NAN), "nan"},
      {Single(0.1F), "0.1"},
      {Date{1772600767}, "2026-03-04 05:06:07 +0000"},
      {Data{std::byte{1}, std::byte{0xAB}}, "{length = 2, bytes = 0x01ab}"},
      {Data(25), "{length = 25, bytes = 0x000000000000000000000000000000000000000000000000...}"},
      {Array{}, "(\n)"},
      {Dictionary{}, "{\n}"},
      {Dictionary{{"list", Array{Int32(1), "two words", Dictionary{{"a-b", "c\n\"\x01"}}}},
                  {"plain", "x_1.y/z"},
                  {"", ""}},
       "{\n    \"\" = \"\";\n    list = (\n        1,\n        \"two words\",\n        {\n"
       "            \"a-b\" = \"c\\n\\\"\\x01\";\n        }\n    );\n    plain = x_1.y/z;\n}"},
  };
  for (const auto& [value, text] : cases) EXPECT_EQ(value.description(), text);
}

}  // namespace
}  // namespace quorlet
