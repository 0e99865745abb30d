#include "drvreport/property_value.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>

namespace quorlet {
namespace {

constexpr auto kMax = std::numeric_limits<std::int64_t>::max();
constexpr auto kUMax = std::numeric_limits<std::uint64_t>::max();
constexpr double kInfinity = std::numeric_limits<double>::infinity();

TEST(Number, ComparesByExactValueAcrossKinds) {
  constexpr std::int64_t kOdd = (std::int64_t{1} << 53) + 1;  // no double holds it
  const std::tuple<PropertyValue, PropertyValue, bool> cases[] = {
      {Int64(5), UInt64(5), true},
      {Int16(-1), UInt64(kUMax), false},
      {Int64(kOdd), Double(static_cast<double>(kOdd)), false},
      {Int64(kMax), Double(std::ldexp(1, 63)), false},
      {UInt64(std::uint64_t{1} << 63), Double(std::ldexp(1, 63)), true},
      {UInt64(kUMax), Double(std::ldexp(1, 64)), false},
      {Single(0.1F), Double(0.1), false},
      {Double(NAN), Double(NAN), false},
      {Int64(kMax), Double(kInfinity), false},
      {Int32(1), true, false},
  };
  for (const auto& [a, b, same] : cases) {
    EXPECT_EQ(a == b, same) << a.description() << " and " << b.description();
    EXPECT_EQ(b == a, same) << b.description() << " and " << a.description();
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
}

}  // namespace
}  // namespace quorlet
