#include "xplat/gbdtclassifier/GbdtClassifier/FeatureMap.h"

#include <gtest/gtest.h>

#include <cmath>
#include <cstdint>
#include <iterator>
#include <limits>
#include <stdexcept>
#include <utility>
#include <vector>

namespace thornvale {
namespace {

using Entries = std::vector<std::pair<int32_t, double>>;

constexpr int32_t kMin = std::numeric_limits<int32_t>::min();
constexpr int32_t kMax = std::numeric_limits<int32_t>::max();

Entries entriesOf(const FeatureMap& map) { return Entries(map.begin(), map.end()); }

TEST(FeatureMapTest, IteratesByAscendingSignedIdAcrossSlotsAndOtherIds) {
  FeatureMap map;
  // Scrambled, so that insertion order cannot pass for the map's order.
  for (int32_t id : {75, 2, kMax, 0, 74, -1, 1000, kMin, 1, 40}) map.emplace(id, id * 0.5);
  const Entries expected = {{kMin, kMin * 0.5}, {-1, -0.5}, {0, 0.0},       {1, 0.5},         {2, 1.0},
                            {40, 20.0},         {74, 37.0}, {75, 37.5},     {1000, 500.0},    {kMax, kMax * 0.5}};
  EXPECT_EQ(entriesOf(map), expected);
  EXPECT_EQ(map.size(), expected.size());

  // find lands on the same place in that order: iterating on from it gives the rest.
  for (size_t i = 0; i < expected.size(); ++i) {
    auto it = map.find(expected[i].first);
    ASSERT_NE(it, map.end()) << expected[i].first;
    EXPECT_EQ(Entries(it, map.end()), Entries(expected.begin() + static_cast<std::ptrdiff_t>(i), expected.end()));
  }
}

TEST(FeatureMapTest, AbsentSlotsAreSkippedAndNotFound) {
  // Without a location, feature 2 is absent among the computed ones.
  FeatureMap computed;
  for (int32_t id = 1; id <= 74; ++id) {
    if (id != 2) computed.emplace(id, 1.0);
  }
  EXPECT_EQ(computed.size(), 73u);
  EXPECT_FALSE(computed.contains(2));
  EXPECT_EQ(computed.find(2), computed.end());
  EXPECT_EQ((*computed.begin()).first, 1);
  EXPECT_EQ((*std::next(computed.begin())).first, 3);

  FeatureMap outside = {{-3, 1.0}, {90, 2.0}};  // no slot filled at all
  EXPECT_EQ(entriesOf(outside), (Entries{{-3, 1.0}, {90, 2.0}}));
  EXPECT_FALSE(outside.contains(1));

  const FeatureMap empty;
  EXPECT_TRUE(empty.empty());
  EXPECT_EQ(empty.begin(), empty.end());
  EXPECT_FALSE(empty.contains(0));
}

TEST(FeatureMapTest, EmplaceKeepsTheFirstValueAndInsertOrAssignReplacesIt) {
  FeatureMap map = {{4, 1.0}, {1000, 1.0}, {4, 2.0}, {-7, 3.0}, {1000, 2.0}};
  EXPECT_EQ(entriesOf(map), (Entries{{-7, 3.0}, {4, 1.0}, {1000, 1.0}}));

  for (int32_t id : {4, 1000, -7}) {
    auto [entry, added] = map.emplace(id, 9.0);
    EXPECT_FALSE(added) << id;
    EXPECT_EQ(entry->first, id);
    EXPECT_NE(entry->second, 9.0) << id;
  }
  auto [entry, added] = map.emplace(5, 9.0);
  EXPECT_TRUE(added);
  EXPECT_EQ(*entry, std::make_pair(5, 9.0));

  // A server feature replaces a computed one of its id, or fills an empty slot.
  map.insert_or_assign(4, 8.0);
  map.insert_or_assign(2, 8.0);
  map.insert_or_assign(1000, 8.0);
  map.insert_or_assign(-7, 8.0);
  map.insert_or_assign(76, 8.0);
  EXPECT_EQ(entriesOf(map), (Entries{{-7, 8.0}, {2, 8.0}, {4, 8.0}, {5, 9.0}, {76, 8.0}, {1000, 8.0}}));
  EXPECT_EQ(map.size(), 6u);
}

TEST(FeatureMapTest, AtThrowsForAbsentIds) {
  const FeatureMap map = {{3, 0.25}, {-2, 0.5}};
  EXPECT_EQ(map.at(3), 0.25);
  EXPECT_EQ(map.at(-2), 0.5);
  EXPECT_THROW(map.at(4), std::out_of_range);
  EXPECT_THROW(map.at(-3), std::out_of_range);
}

TEST(FeatureMapTest, EqualityComparesIdsAndValuesNotHistory) {
  const FeatureMap a = {{1, 1.0}, {-5, 2.0}, {80, 3.0}};
  EXPECT_EQ(a, (FeatureMap{{80, 3.0}, {1, 1.0}, {-5, 2.0}}));
  EXPECT_NE(a, (FeatureMap{{1, 1.0}, {-5, 2.0}, {80, 4.0}}));
  EXPECT_NE(a, (FeatureMap{{1, 1.0}, {-5, 2.0}}));
  // An absent slot differs from one that holds the value a slot starts with.
  EXPECT_NE(FeatureMap(), (FeatureMap{{7, 0.0}}));
  EXPECT_NE((FeatureMap{{7, 0.0}, {8, 1.0}}), (FeatureMap{{8, 1.0}, {9, 0.0}}));
  // Like the standard maps: values compare with ==, so NaN equals nothing.
  const FeatureMap nan = {{7, std::nan("")}};
  EXPECT_NE(nan, nan);
}

}  // namespace
}  // namespace thornvale
