#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <numeric>
#include <string>
#include <vector>

#include "gradient_checker.h"

namespace nn {
namespace {

// Pools a plane whose values count up from 0, row by row.
std::vector<float> PoolRamp(int height, int width, const std::string& pooling,
                            std::vector<int>* shape = nullptr) {
  Blob<float> in(1, 1, height, width);
  std::iota(in.mutable_cpu_data(), in.mutable_cpu_data() + in.count(), 0.0f);
  OneLayer pool("type: POOLING pooling_param { " + pooling + " }", &in);
  if (shape) {
    *shape = Shape(pool.out);
  }
  return pool.Forward();
}

TEST(PoolingLayerTest, SizesRoundUpAndAveragesCountPadding) {
  // Height 10, kernel 3, stride 2: ceil(7 / 2) + 1 = 5 rows (a convolution
  // gets 4); the last window holds rows 8 and 9 only. Values are 4 row + column.
  std::vector<int> shape;
  EXPECT_EQ(PoolRamp(10, 4, "kernel_size: 3 stride: 2", &shape),
            (std::vector<float>{10, 11, 18, 19, 26, 27, 34, 35, 38, 39}));
  EXPECT_EQ(shape, (std::vector<int>{1, 1, 5, 2}));

  // Padding cells count in the divisor: the corner is (0 + 1 + 3 + 4) / 9.
  const std::vector<float> average = PoolRamp(3, 3, "pool: AVE kernel_size: 3 pad: 1");
  ASSERT_EQ(average.size(), 9u);
  EXPECT_FLOAT_EQ(average[0], 8.0f / 9.0f);
  EXPECT_FLOAT_EQ(average[4], 36.0f / 9.0f);

  // Width 5, kernel 1, stride 3: windows at 0, 3 and 6, the last outside the
  // image, where each method keeps its start value.
  const std::vector<float> max = PoolRamp(1, 5, "kernel_size: 1 stride: 3");
  EXPECT_EQ(max, (std::vector<float>{0, 3, std::numeric_limits<float>::lowest()}));
  const std::vector<float> outside = PoolRamp(1, 5, "pool: AVE kernel_size: 1 stride: 3");
  EXPECT_EQ(outside[2], 0.0f);
  EXPECT_TRUE(std::signbit(outside[2])) << "0 divided by a negative window size";
}

TEST(PoolingLayerTest, AlterInputShapeFollowsTheBottom) {
  Blob<float> in(1, 1, 10, 10);
  OneLayer pool("type: POOLING pooling_param { kernel_size: 3 stride: 2 }", &in);
  const size_t bytes = pool.out.data()->size();
  in.RewriteShape(1, 1, 6, 5);
  pool.layer->AlterInputShape(5, 6, pool.bottom, &pool.top);
  EXPECT_EQ(Shape(pool.out), (std::vector<int>{1, 1, 3, 2}));  // ceil(3 / 2) + 1, ceil(2 / 2) + 1
  EXPECT_EQ(pool.out.data()->size(), bytes);
}

TEST(PoolingLayerDeathTest, PaddingOnlyForAverageAndUnknownMethods) {
  Blob<float> in(1, 1, 4, 4);
  EXPECT_DEATH(OneLayer("type: POOLING pooling_param { kernel_size: 2 pad: 1 }", &in),
               "Padding implemented only for average pooling.");
  EXPECT_DEATH(OneLayer("type: POOLING pooling_param { pool: STOCHASTIC kernel_size: 2 }", &in)
                   .Forward(),
               "Not Implemented Yet");
}

}  // namespace
}  // namespace nn
