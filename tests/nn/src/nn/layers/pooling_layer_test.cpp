#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <vector>

#include "gradient_checker.h"
#include "nn/vision_layers.h"

namespace nn {
namespace {

LayerParameter PoolParam(PoolingParameter::PoolMethod method, int kernel, int stride, int pad) {
  LayerParameter param;
  param.mutable_pooling_param()->set_pool(method);
  param.mutable_pooling_param()->set_kernel_size(kernel);
  param.mutable_pooling_param()->set_stride(stride);
  param.mutable_pooling_param()->set_pad(pad);
  return param;
}

struct PoolFixture {
  PoolFixture(int height, int width, const LayerParameter& param)
      : in(1, 1, height, width), layer(param) {
    for (int i = 0; i < in.count(); ++i) {
      in.mutable_cpu_data()[i] = static_cast<float>(i);
    }
    layer.SetUp(bottom, &top);
    layer.Forward(bottom, &top);
  }
  std::vector<float> output() const { return {out.cpu_data(), out.cpu_data() + out.count()}; }

  Blob<float> in;
  Blob<float> out;
  std::vector<Blob<float>*> bottom = {&in};
  std::vector<Blob<float>*> top = {&out};
  PoolingLayer<float> layer;
};

TEST(PoolingLayerTest, SizesRoundUpSoTheLastWindowHangsOver) {
  // Height 10, kernel 3, stride 2: ceil(7 / 2) + 1 = 5 rows (a convolution gets 4).
  PoolFixture max(10, 4, PoolParam(PoolingParameter::MAX, 3, 2, 0));
  EXPECT_EQ(max.out.height(), 5);
  EXPECT_EQ(max.out.width(), 2);  // ceil(1 / 2) + 1
  // The last row's window holds rows 8 and 9 only; values are 4 * row + column.
  EXPECT_EQ(max.output(), (std::vector<float>{10, 11, 18, 19, 26, 27, 34, 35, 38, 39}));

}

TEST(PoolingLayerTest, AverageCountsPaddingInTheDivisor) {
  PoolFixture ave(3, 3, PoolParam(PoolingParameter::AVE, 3, 1, 1));
  ASSERT_EQ(ave.out.count(), 9);
  // Corner (0, 0): cells 0, 1, 3, 4 over a window of 9.
  EXPECT_FLOAT_EQ(ave.output()[0], 8.0f / 9.0f);
  EXPECT_FLOAT_EQ(ave.output()[4], 36.0f / 9.0f);
}

TEST(PoolingLayerTest, LastWindowOutsideTheImageKeepsItsStartValue) {
  // Width 5, kernel 1, stride 3: ceil(4 / 3) + 1 = 3 windows at 0, 3 and 6.
  PoolFixture max(1, 5, PoolParam(PoolingParameter::MAX, 1, 3, 0));
  ASSERT_EQ(max.out.width(), 3);
  EXPECT_EQ(max.output()[1], 3.0f);
  EXPECT_EQ(max.output()[2], std::numeric_limits<float>::lowest());
  PoolFixture ave(1, 5, PoolParam(PoolingParameter::AVE, 1, 3, 0));
  EXPECT_EQ(ave.output()[2], 0.0f);
  EXPECT_TRUE(std::signbit(ave.output()[2])) << "0 divided by a negative window size";
}

TEST(PoolingLayerTest, AlterInputShapeFollowsTheBottom) {
  PoolFixture max(10, 10, PoolParam(PoolingParameter::MAX, 3, 2, 0));
  const size_t bytes = max.out.data()->size();
  max.in.RewriteShape(1, 1, 6, 5);
  max.layer.AlterInputShape(5, 6, max.bottom, &max.top);
  EXPECT_EQ(max.out.height(), 3);  // ceil(3 / 2) + 1
  EXPECT_EQ(max.out.width(), 2);   // ceil(2 / 2) + 1
  EXPECT_EQ(max.out.data()->size(), bytes);
}

TEST(PoolingLayerTest, GradientsMatchFiniteDifferences) {
  for (auto method : {PoolingParameter::MAX, PoolingParameter::AVE}) {
    Blob<float> in(2, 2, 7, 6);
    FillUniform(&in, -1, 1);
    Blob<float> out;
    std::vector<Blob<float>*> bottom = {&in};
    std::vector<Blob<float>*> top = {&out};
    PoolingLayer<float> layer(PoolParam(method, 3, 2, method == PoolingParameter::AVE ? 1 : 0));
    layer.SetUp(bottom, &top);
    GradientChecker(1e-3f, 1e-2f).Check(&layer, bottom, &top);
  }
}

TEST(PoolingLayerDeathTest, PaddingOnlyForAverageAndUnknownMethods) {
  Blob<float> in(1, 1, 4, 4);
  Blob<float> out;
  std::vector<Blob<float>*> bottom = {&in};
  std::vector<Blob<float>*> top = {&out};
  EXPECT_DEATH(PoolingLayer<float>(PoolParam(PoolingParameter::MAX, 2, 1, 1)).SetUp(bottom, &top),
               "Padding implemented only for average pooling.");
  EXPECT_DEATH(
      {
        PoolingLayer<float> layer(PoolParam(PoolingParameter::STOCHASTIC, 2, 1, 0));
        layer.SetUp(bottom, &top);
        layer.Forward(bottom, &top);
      },
      "Not Implemented Yet");
}

}  // namespace
}  // namespace nn
