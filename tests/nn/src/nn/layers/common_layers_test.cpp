#include <gtest/gtest.h>

#include <numeric>
#include <vector>

#include "gradient_checker.h"
#include "nn/common_layers.h"

namespace nn {
namespace {

void Ramp(Blob<float>* blob, float start) {
  std::iota(blob->mutable_cpu_data(), blob->mutable_cpu_data() + blob->count(), start);
}

TEST(InnerProductLayerTest, ImagesAreFlatRowsTimesTheWeightsPlusTheBias) {
  Blob<float> in(2, 1, 2, 2);
  Ramp(&in, 0);
  OneLayer ip("type: INNER_PRODUCT inner_product_param { num_output: 2 }", &in);
  ASSERT_EQ(Shape(*ip.layer->blobs()[0]), (std::vector<int>{1, 1, 2, 4}));
  SetValues(ip.layer->blobs()[0].get(), {1, 0, 0, 0, 0, 1, 1, 1});
  SetValues(ip.layer->blobs()[1].get(), {0, 10});
  EXPECT_EQ(ip.Forward(), (std::vector<float>{0, 16, 4, 28}));
}

TEST(PlumbingLayersTest, ConcatJoinsSplitAndFlattenShareEltwiseMultiplies) {
  Blob<float> a(1, 2, 1, 2);
  Blob<float> b(1, 1, 1, 2);
  Blob<float> c(2, 2, 1, 2);
  Ramp(&a, 0);
  Ramp(&b, 10);
  Ramp(&c, 20);
  Blob<float> out;
  Blobs top = {&out};
  Blobs by_channels = {&a, &b};
  ConcatLayer<float> channels{LayerParameter()};
  channels.SetUp(by_channels, &top);
  channels.Forward(by_channels, &top);
  EXPECT_EQ(Shape(out), (std::vector<int>{1, 3, 1, 2}));
  EXPECT_EQ(Values(out), (std::vector<float>{0, 1, 2, 3, 10, 11}));
  Blobs by_num = {&a, &c};
  ConcatLayer<float> nums(Parse<LayerParameter>("concat_param { concat_dim: 0 }"));
  nums.SetUp(by_num, &top);
  nums.Forward(by_num, &top);
  EXPECT_EQ(Values(out), (std::vector<float>{0, 1, 2, 3, 20, 21, 22, 23, 24, 25, 26, 27}));

  Blob<float> second;
  Blobs bottom = {&c};
  Blobs tops = {&out, &second};
  SplitLayer<float> split{LayerParameter()};
  split.SetUp(bottom, &tops);
  split.Forward(bottom, &tops);
  EXPECT_EQ(second.cpu_data(), c.cpu_data()) << "no data moves";
  OneLayer flatten("type: FLATTEN", &c);
  flatten.Forward();
  EXPECT_EQ(Shape(flatten.out), (std::vector<int>{2, 4, 1, 1}));
  EXPECT_EQ(flatten.out.cpu_data(), c.cpu_data());

  Blobs factors = {&c, &c, &c};
  EltwiseProductLayer<float> multiply{LayerParameter()};
  multiply.SetUp(factors, &top);
  multiply.Forward(factors, &top);
  EXPECT_EQ(out.cpu_data()[7], 27.0f * 27 * 27);

  Blob<float> image(2, 2, 4, 5);
  EXPECT_EQ(Shape(OneLayer("type: IM2COL convolution_param { kernel_size: 3 pad: 1 stride: 2 }",
                           &image).out),
            (std::vector<int>{2, 18, 2, 3}));
}

TEST(PlumbingLayersDeathTest, SetUpChecks) {
  Blob<float> a(1, 2, 3, 3);
  Blob<float> b(1, 1, 2, 3);
  Blob<float> out;
  Blobs one = {&a};
  Blobs unequal = {&a, &b};
  Blobs top = {&out};
  EXPECT_DEATH(ConcatLayer<float>(LayerParameter()).SetUp(one, &top),
               "Concat Layer takes at least two blobs as input.");
  EXPECT_DEATH(ConcatLayer<float>(Parse<LayerParameter>("concat_param { concat_dim: 2 }"))
                   .SetUp(unequal, &top),
               "For now concat_dim <=1, it can only concat num and channels");
  EXPECT_DEATH(ConcatLayer<float>(LayerParameter()).SetUp(unequal, &top),
               "Check failed: count_ == \\(\\*top\\)\\[0\\]->count\\(\\) ");
  Blobs in_place_second = {&out, &a};
  EXPECT_DEATH(SplitLayer<float>(LayerParameter()).SetUp(one, &in_place_second),
               "Only 0th top blob may be in place.");
  EXPECT_DEATH(EltwiseProductLayer<float>(LayerParameter()).SetUp(unequal, &top),
               "Check failed: channels == bottom\\[i\\]->channels\\(\\) ");
  EXPECT_DEATH(InnerProductLayer<float>(LayerParameter()).SetUp(unequal, &top),
               "IP Layer takes a single blob as input.");
}

}  // namespace
}  // namespace nn
