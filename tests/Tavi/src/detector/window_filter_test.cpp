#include "detector/window_filter.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <vector>

namespace tavilib {
namespace {

Window W(int x, int y, int width, int height, float score) {
  return Window{x, y, width, height, score, 0};
}

// Per size, windows of one width suppress each other above 0.5 of their
// union; finally, any two suppress each other above 0.25 of the smaller area.
TEST(WindowFilterTest, MergesKeepTheBetterOfTwoWindowsOverlappingBeyondTheirLimit) {
  const struct { Window a, b; size_t perSize, final; } cases[] = {
      {W(0, 0, 10, 12, 0.6f), W(0, 4, 10, 12, 0.9f), 2, 1},   // 80 / 160; 80 / 120
      {W(0, 0, 10, 12, 0.6f), W(0, 3, 10, 12, 0.9f), 1, 1},   // 90 / 150
      {W(0, 0, 10, 10, 0.6f), W(10, 0, 10, 10, 0.9f), 2, 2},  // touching: no intersection
      {W(0, 0, 40, 40, 0.9f), W(10, 10, 5, 5, 0.8f), 2, 1},   // nested either way round
      {W(0, 0, 40, 40, 0.9f), W(10, 10, 5, 5, 0.95f), 2, 1},
      {W(0, 0, 40, 40, 0.5f), W(36, 0, 10, 5, 0.9f), 2, 1},   // 20 / 1600, but 20 / 50
      {W(0, 0, 10, 10, 0.3f), W(5, 5, 10, 10, 0.4f), 2, 2},   // 25 / 100 exactly
      {W(0, 0, 10, 10, 0.3f), W(6, 3, 10, 10, 0.4f), 2, 1},   // 28 / 100
      {W(0, 0, 10, 10, 0.7f), W(0, 0, 12, 12, 0.6f), 2, 1}};  // same place, other widths
  for (const auto& c : cases) {
    const auto check = [&c](const std::vector<Window>& merged, size_t count) {
      ASSERT_EQ(merged.size(), count) << c.b.x << "," << c.b.y << " " << c.b.width;
      if (count == 1) {
        EXPECT_EQ(merged[0].score, std::max(c.a.score, c.b.score));
      }
    };
    check(mergePerSize({c.a, c.b}), c.perSize);
    check(mergeFinal({c.a, c.b}), c.final);
  }
  EXPECT_TRUE(mergePerSize({}).empty());
  EXPECT_TRUE(mergeFinal({}).empty());
}

TEST(WindowFilterTest, PerSizeMergeGroupsByWidthInOrderOfFirstAppearance) {
  const std::vector<Window> windows = {
      W(0, 0, 10, 10, 0.5f),   // group of width 10
      W(0, 0, 20, 20, 0.95f),  // group of width 20, same corner
      W(40, 0, 10, 10, 0.8f),  // width 10, apart
      W(1, 0, 10, 10, 0.7f),   // width 10, over the first: suppresses it
      W(0, 0, 20, 10, -0.1f),  // below the score limit of 0
  };
  const std::vector<Window> merged = mergePerSize(windows);
  ASSERT_EQ(merged.size(), 3u);
  EXPECT_EQ((std::vector<float>{merged[0].score, merged[1].score, merged[2].score}),
            (std::vector<float>{0.8f, 0.7f, 0.95f}))
      << "groups are not interleaved by score, and other widths do not suppress";
}

}  // namespace
}  // namespace tavilib
