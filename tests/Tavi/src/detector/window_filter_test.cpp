#include "detector/window_filter.h"

#include <gtest/gtest.h>

#include <vector>

namespace tavilib {
namespace {

Window makeWindow(int x, int y, int width, int height, float score) {
  return Window{x, y, width, height, score, 0};
}

std::vector<float> scoresOf(const std::vector<Window>& windows) {
  std::vector<float> scores;
  for (const Window& w : windows) {
    scores.push_back(w.score);
  }
  return scores;
}

TEST(WindowFilterTest, EmptyListsStayEmpty) {
  std::vector<Window> none;
  sortByScore(none);
  EXPECT_TRUE(none.empty());
  EXPECT_TRUE(keepAboveThreshold(none, 0.5f).empty());
  EXPECT_TRUE(mergePerSize(none).empty());
  EXPECT_TRUE(mergeFinal(none).empty());
}

TEST(WindowFilterTest, SortPutsHighestFirstAndThresholdIsStrict) {
  std::vector<Window> windows = {makeWindow(0, 0, 1, 1, 0.2f), makeWindow(1, 0, 1, 1, 0.9f),
                                 makeWindow(2, 0, 1, 1, 0.4f), makeWindow(3, 0, 1, 1, 0.5f)};
  sortByScore(windows);
  EXPECT_EQ(scoresOf(windows), (std::vector<float>{0.9f, 0.5f, 0.4f, 0.2f}));

  const std::vector<Window> kept = keepAboveThreshold(windows, 0.4f);
  EXPECT_EQ(scoresOf(kept), (std::vector<float>{0.9f, 0.5f})) << "a score equal to t is dropped";
  EXPECT_EQ(kept[1].x, 3);
}

TEST(WindowFilterTest, PerSizeMergeSuppressesByUnionOverlapAboveOneHalf) {
  // Same width, 10x12 boxes: a vertical shift of 4 gives 80 / 160 = 0.5 exactly.
  const std::vector<Window> half = {makeWindow(0, 0, 10, 12, 0.6f),
                                    makeWindow(0, 4, 10, 12, 0.9f)};
  EXPECT_EQ(scoresOf(mergePerSize(half)), (std::vector<float>{0.9f, 0.6f}));

  // A shift of 3 gives 90 / 150 = 0.6: the weaker one goes.
  const std::vector<Window> more = {makeWindow(0, 0, 10, 12, 0.6f),
                                    makeWindow(0, 3, 10, 12, 0.9f)};
  const std::vector<Window> merged = mergePerSize(more);
  ASSERT_EQ(merged.size(), 1u);
  EXPECT_EQ(merged[0].y, 3);

  // Touching along an edge is no intersection at all.
  const std::vector<Window> touching = {makeWindow(0, 0, 10, 10, 0.6f),
                                        makeWindow(10, 0, 10, 10, 0.9f)};
  EXPECT_EQ(mergePerSize(touching).size(), 2u);
}

TEST(WindowFilterTest, PerSizeMergeGroupsByWidthInOrderOfFirstAppearance) {
  const std::vector<Window> windows = {
      makeWindow(0, 0, 10, 10, 0.5f),   // group of width 10
      makeWindow(0, 0, 20, 20, 0.95f),  // group of width 20, same corner
      makeWindow(40, 0, 10, 10, 0.8f),  // width 10, apart
      makeWindow(1, 0, 10, 10, 0.7f),   // width 10, over the first: suppresses it
      makeWindow(0, 0, 20, 10, -0.1f),  // below the score limit of 0
  };
  const std::vector<Window> merged = mergePerSize(windows);
  EXPECT_EQ(scoresOf(merged), (std::vector<float>{0.8f, 0.7f, 0.95f}))
      << "groups are not interleaved by score, and other widths do not suppress";
}

TEST(WindowFilterTest, FinalMergeUsesTheSmallerAreaEitherWay) {
  const Window large = makeWindow(0, 0, 40, 40, 0.9f);
  const Window inside = makeWindow(10, 10, 5, 5, 0.8f);
  EXPECT_EQ(scoresOf(mergeFinal({inside, large})), (std::vector<float>{0.9f}));

  const Window betterInside = makeWindow(10, 10, 5, 5, 0.95f);
  EXPECT_EQ(scoresOf(mergeFinal({large, betterInside})), (std::vector<float>{0.95f}));

  // 20 / 1600 of the large candidate, but 20 / 50 = 0.4 of the small kept one.
  const Window smallKept = makeWindow(36, 0, 10, 5, 0.9f);
  const Window largeCandidate = makeWindow(0, 0, 40, 40, 0.5f);
  EXPECT_EQ(mergeFinal({largeCandidate, smallKept}).size(), 1u);

  // 25 / 100 = 0.25 exactly survives.
  const std::vector<Window> quarter = {makeWindow(0, 0, 10, 10, 0.3f),
                                       makeWindow(5, 5, 10, 10, 0.4f)};
  EXPECT_EQ(scoresOf(mergeFinal(quarter)), (std::vector<float>{0.4f, 0.3f}));

  // Equal position, different widths: kept apart by size, merged finally.
  const std::vector<Window> nested = {makeWindow(0, 0, 10, 10, 0.7f),
                                      makeWindow(0, 0, 12, 12, 0.6f)};
  EXPECT_EQ(mergePerSize(nested).size(), 2u);
  EXPECT_EQ(scoresOf(mergeFinal(nested)), (std::vector<float>{0.7f}));
}

}  // namespace
}  // namespace tavilib
