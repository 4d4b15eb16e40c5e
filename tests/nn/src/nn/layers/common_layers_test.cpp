#include <gtest/gtest.h>

#include <vector>

#include "gradient_checker.h"
#include "nn/common_layers.h"
#include "nn/vision_layers.h"

namespace nn {
namespace {

std::vector<float> Values(const Blob<float>& blob) {
  return {blob.cpu_data(), blob.cpu_data() + blob.count()};
}

void Ramp(Blob<float>* blob, float start) {
  for (int i = 0; i < blob->count(); ++i) {
    blob->mutable_cpu_data()[i] = start + i;
  }
}

TEST(InnerProductLayerTest, ImagesAreFlatRowsTimesTheWeights) {
  Blob<float> in(2, 1, 2, 2);
  Ramp(&in, 0);
  Blob<float> out;
  std::vector<Blob<float>*> bottom = {&in};
  std::vector<Blob<float>*> top = {&out};
  LayerParameter param;
  param.mutable_inner_product_param()->set_num_output(2);
  InnerProductLayer<float> layer(param);
  layer.SetUp(bottom, &top);
  ASSERT_EQ(layer.blobs()[0]->height(), 2);
  ASSERT_EQ(layer.blobs()[0]->width(), 4);
  const float weights[] = {1, 0, 0, 0, 0, 1, 1, 1};
  std::copy(weights, weights + 8, layer.blobs()[0]->mutable_cpu_data());
  layer.blobs()[1]->mutable_cpu_data()[1] = 10;
  layer.Forward(bottom, &top);
  EXPECT_EQ(Values(out), (std::vector<float>{0, 16, 4, 28}));

  FillUniform(layer.blobs()[0].get(), -1, 1, 5);
  FillUniform(layer.blobs()[1].get(), -1, 1, 6);
  GradientChecker(1e-2f, 1e-2f).Check(&layer, bottom, &top);
}

TEST(ConcatLayerTest, JoinsAlongNumOrChannels) {
  Blob<float> a(1, 2, 1, 2);
  Blob<float> b(1, 1, 1, 2);
  Ramp(&a, 0);
  Ramp(&b, 10);
  Blob<float> out;
  std::vector<Blob<float>*> bottom = {&a, &b};
  std::vector<Blob<float>*> top = {&out};
  ConcatLayer<float> channels{LayerParameter()};
  channels.SetUp(bottom, &top);
  channels.Forward(bottom, &top);
  EXPECT_EQ(out.channels(), 3);
  EXPECT_EQ(Values(out), (std::vector<float>{0, 1, 2, 3, 10, 11}));
  GradientChecker(1e-2f, 1e-3f).Check(&channels, bottom, &top);

  Blob<float> c(2, 2, 1, 2);
  Ramp(&c, 20);
  std::vector<Blob<float>*> by_num = {&a, &c};
  LayerParameter param;
  param.mutable_concat_param()->set_concat_dim(0);
  ConcatLayer<float> nums(param);
  nums.SetUp(by_num, &top);
  nums.Forward(by_num, &top);
  EXPECT_EQ(out.num(), 3);
  EXPECT_EQ(Values(out)[4], 20.0f);
  GradientChecker(1e-2f, 1e-3f).Check(&nums, by_num, &top);
}

TEST(SplitFlattenAndProductLayersTest, ShareOrMultiply) {
  Blob<float> in(2, 3, 2, 1);
  FillUniform(&in, 0.5f, 2.0f);
  Blob<float> first;
  Blob<float> second;
  std::vector<Blob<float>*> bottom = {&in};
  std::vector<Blob<float>*> tops = {&first, &second};
  SplitLayer<float> split{LayerParameter()};
  split.SetUp(bottom, &tops);
  split.Forward(bottom, &tops);
  EXPECT_EQ(second.cpu_data(), in.cpu_data()) << "no data moves";
  GradientChecker(1e-2f, 1e-3f).Check(&split, bottom, &tops);

  Blob<float> flat;
  std::vector<Blob<float>*> flat_top = {&flat};
  FlattenLayer<float> flatten{LayerParameter()};
  flatten.SetUp(bottom, &flat_top);
  flatten.Forward(bottom, &flat_top);
  EXPECT_EQ(flat.channels(), 6);
  EXPECT_EQ(flat.height(), 1);
  EXPECT_EQ(flat.cpu_data(), in.cpu_data());

  Blob<float> other(2, 3, 2, 1);
  Blob<float> third(2, 3, 2, 1);
  FillUniform(&other, 0.5f, 2.0f, 2);
  FillUniform(&third, -2.0f, -0.5f, 3);
  Blob<float> product;
  std::vector<Blob<float>*> factors = {&in, &other, &third};
  std::vector<Blob<float>*> product_top = {&product};
  EltwiseProductLayer<float> multiply{LayerParameter()};
  multiply.SetUp(factors, &product_top);
  multiply.Forward(factors, &product_top);
  EXPECT_FLOAT_EQ(product.cpu_data()[7],
                  in.cpu_data()[7] * other.cpu_data()[7] * third.cpu_data()[7]);
  GradientChecker(1e-2f, 1e-2f).Check(&multiply, factors, &product_top);
}

TEST(Im2colLayerTest, UnfoldsPerImageAndFoldsBack) {
  Blob<float> in(2, 2, 4, 5);
  FillUniform(&in, -1, 1);
  Blob<float> out;
  std::vector<Blob<float>*> bottom = {&in};
  std::vector<Blob<float>*> top = {&out};
  LayerParameter param;
  param.mutable_convolution_param()->set_kernel_size(3);
  param.mutable_convolution_param()->set_pad(1);
  param.mutable_convolution_param()->set_stride(2);
  Im2colLayer<float> layer(param);
  layer.SetUp(bottom, &top);
  EXPECT_EQ(out.channels(), 18);
  EXPECT_EQ(out.height(), 2);
  EXPECT_EQ(out.width(), 3);
  GradientChecker(1e-2f, 1e-3f).Check(&layer, bottom, &top);
}

TEST(PlumbingLayersDeathTest, SetUpChecks) {
  Blob<float> a(1, 2, 3, 3);
  Blob<float> b(1, 1, 2, 3);
  Blob<float> out;
  std::vector<Blob<float>*> one = {&a};
  std::vector<Blob<float>*> unequal = {&a, &b};
  std::vector<Blob<float>*> top = {&out};
  EXPECT_DEATH(ConcatLayer<float>(LayerParameter()).SetUp(one, &top),
               "Concat Layer takes at least two blobs as input.");
  LayerParameter dim2;
  dim2.mutable_concat_param()->set_concat_dim(2);
  EXPECT_DEATH(ConcatLayer<float>(dim2).SetUp(unequal, &top),
               "For now concat_dim <=1, it can only concat num and channels");
  EXPECT_DEATH(ConcatLayer<float>(LayerParameter()).SetUp(unequal, &top),
               "Check failed: count_ == \\(\\*top\\)\\[0\\]->count\\(\\) ");
  std::vector<Blob<float>*> in_place_second = {&out, &a};
  EXPECT_DEATH(SplitLayer<float>(LayerParameter()).SetUp(one, &in_place_second),
               "Only 0th top blob may be in place.");
  EXPECT_DEATH(EltwiseProductLayer<float>(LayerParameter()).SetUp(unequal, &top),
               "Check failed: channels == bottom\\[i\\]->channels\\(\\) ");
  EXPECT_DEATH(InnerProductLayer<float>(LayerParameter()).SetUp(unequal, &top),
               "IP Layer takes a single blob as input.");
}

}  // namespace
}  // namespace nn
