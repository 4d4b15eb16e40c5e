#include <gtest/gtest.h>

#include <cmath>
#include <vector>

#include "gradient_checker.h"
#include "nn/vision_layers.h"

namespace nn {
namespace {

LayerParameter LrnParam(int size, float alpha, float beta, LRNParameter::NormRegion region) {
  LayerParameter param;
  param.mutable_lrn_param()->set_local_size(size);
  param.mutable_lrn_param()->set_alpha(alpha);
  param.mutable_lrn_param()->set_beta(beta);
  param.mutable_lrn_param()->set_norm_region(region);
  return param;
}

// x * (1 + alpha / size * sum of squares over channels c - pre_pad to
// c - pre_pad + size - 1) ^ -beta, channels outside counting as zero.
float AcrossChannels(const Blob<float>& in, int n, int c, int h, int w, int size, float alpha,
                     float beta) {
  const int pre_pad = (size - 1) / 2;
  double sum = 0;
  for (int k = c - pre_pad; k < c - pre_pad + size; ++k) {
    if (k >= 0 && k < in.channels()) {
      const float x = in.cpu_data()[in.offset(n, k, h, w)];
      sum += x * x;
    }
  }
  return in.cpu_data()[in.offset(n, c, h, w)] * std::pow(1.0 + alpha / size * sum, -beta);
}

// The same within a size x size window of one channel, zero padded, divided
// by the full window size.
float WithinChannel(const Blob<float>& in, int n, int c, int h, int w, int size, float alpha,
                    float beta) {
  const int pre_pad = (size - 1) / 2;
  double sum = 0;
  for (int y = h - pre_pad; y < h - pre_pad + size; ++y) {
    for (int x = w - pre_pad; x < w - pre_pad + size; ++x) {
      if (y >= 0 && y < in.height() && x >= 0 && x < in.width()) {
        const float v = in.cpu_data()[in.offset(n, c, y, x)];
        sum += v * v;
      }
    }
  }
  return in.cpu_data()[in.offset(n, c, h, w)] *
         std::pow(1.0 + alpha * sum / (size * size), -beta);
}

TEST(LRNLayerTest, AcrossChannelsMatchesTheWindowFormulaAtEdgesAndForEvenSizes) {
  for (int size : {9, 4, 3}) {
    Blob<float> in(2, 7, 3, 2);
    FillUniform(&in, -3, 3);
    Blob<float> out;
    std::vector<Blob<float>*> bottom = {&in};
    std::vector<Blob<float>*> top = {&out};
    LRNLayer<float> layer(LrnParam(size, 0.5f, 0.75f, LRNParameter::ACROSS_CHANNELS));
    layer.SetUp(bottom, &top);
    layer.Forward(bottom, &top);
    for (int n = 0; n < 2; ++n) {
      for (int c = 0; c < 7; ++c) {
        for (int i = 0; i < 6; ++i) {
          EXPECT_NEAR(out.cpu_data()[out.offset(n, c) + i],
                      AcrossChannels(in, n, c, i / 2, i % 2, size, 0.5f, 0.75f), 1e-5)
              << "size " << size << " channel " << c;
        }
      }
    }
    GradientChecker(1e-2f, 1e-2f).Check(&layer, bottom, &top);
  }
}

TEST(LRNLayerTest, WithinChannelMatchesTheWindowFormula) {
  Blob<float> in(1, 2, 4, 5);
  FillUniform(&in, -2, 2);
  Blob<float> out;
  std::vector<Blob<float>*> bottom = {&in};
  std::vector<Blob<float>*> top = {&out};
  LRNLayer<float> layer(LrnParam(3, 2.0f, 0.75f, LRNParameter::WITHIN_CHANNEL));
  layer.SetUp(bottom, &top);
  layer.Forward(bottom, &top);
  for (int c = 0; c < 2; ++c) {
    for (int i = 0; i < 20; ++i) {
      EXPECT_NEAR(out.cpu_data()[out.offset(0, c) + i],
                  WithinChannel(in, 0, c, i / 5, i % 5, 3, 2.0f, 0.75f), 1e-5);
    }
  }
  GradientChecker(1e-2f, 1e-2f).Check(&layer, bottom, &top);
}

TEST(LRNLayerTest, AlterInputShapeRewritesTopAndScale) {
  Blob<float> in(1, 4, 6, 6);
  Blob<float> out;
  std::vector<Blob<float>*> bottom = {&in};
  std::vector<Blob<float>*> top = {&out};
  LRNLayer<float> layer(LrnParam(3, 1.0f, 0.75f, LRNParameter::ACROSS_CHANNELS));
  layer.SetUp(bottom, &top);
  in.RewriteShape(1, 4, 2, 3);
  FillUniform(&in, -1, 1);
  layer.AlterInputShape(3, 2, bottom, &top);
  EXPECT_EQ(out.count(), 24);
  layer.Forward(bottom, &top);
  EXPECT_NEAR(out.cpu_data()[out.offset(0, 3, 1, 2)],
              AcrossChannels(in, 0, 3, 1, 2, 3, 1.0f, 0.75f), 1e-5);
}

}  // namespace
}  // namespace nn
