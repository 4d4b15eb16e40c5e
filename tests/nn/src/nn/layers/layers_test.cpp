#include <gtest/gtest.h>

#include <cmath>
#include <memory>
#include <string>
#include <vector>

#include "blob_proto_maker.h"
#include "gradient_checker.h"
#include "nn/loss_layers.h"
#include "nn/vision_layers.h"
#include "nn/util/io.h"
#include "temp_dir.h"

namespace nn {
namespace {

// Bottoms of the given shapes, drawn from [0.1, 0.9), a last bottom of
// labels if any are given, and `tops` empty tops.
struct LayerBlobs {
  LayerBlobs(const std::vector<std::vector<int>>& shapes, int tops,
             const std::vector<float>& labels = {}) {
    for (const auto& shape : shapes) {
      bottom.push_back(Add(shape[0], shape[1], shape[2], shape[3]));
      FillUniform(bottom.back(), 0.1f, 0.9f, static_cast<unsigned>(owned.size()));
    }
    if (!labels.empty()) {
      bottom.push_back(Add(static_cast<int>(labels.size()), 1, 1, 1));
      SetValues(bottom.back(), labels);
    }
    for (int t = 0; t < tops; ++t) {
      top.push_back(Add(0, 0, 0, 0));
    }
  }
  Blob<float>* Add(int num, int channels, int height, int width) {
    owned.emplace_back(new Blob<float>(num, channels, height, width));
    return owned.back().get();
  }
  std::vector<std::unique_ptr<Blob<float>>> owned;
  Blobs bottom;
  Blobs top;
};

std::unique_ptr<Layer<float>> Make(const std::string& text) {
  return std::unique_ptr<Layer<float>>(GetLayer<float>(Parse<LayerParameter>(text)));
}

// An information gain matrix of the given side, and the layer reading it.
std::string Infogain(const TempDir& dir, int side, const std::vector<float>& gains) {
  EXPECT_TRUE(WriteProtoToBinaryFile(MakeBlob(1, 1, side, side, gains), dir.path() + "/gains"));
  return "type: INFOGAIN_LOSS infogain_loss_param { source: '" + dir.path() + "/gains' }";
}

TEST(LayerGradientTest, BackwardMatchesFiniteDifferencesForEveryLayerType) {
  TempDir dir;
  std::vector<float> gains(36);
  for (int i = 0; i < 36; ++i) {
    gains[i] = static_cast<float>((i * 7) % 5) / 4;
  }
  const std::string filled =
      "weight_filler { type: 'uniform' min: -1 max: 1 } bias_filler { type: 'uniform' } ";
  const std::vector<std::vector<int>> x = {{2, 3, 2, 2}};
  const std::vector<std::vector<int>> p = {{2, 3, 2, 1}};
  const std::vector<std::vector<int>> im = {{2, 2, 7, 6}};
  const struct {
    std::string layer;
    std::vector<std::vector<int>> bottoms;
    int tops;
    float step;
    std::vector<float> labels = {};
  } cases[] = {
      // Inputs lie in [0.1, 0.9]: away from the kinks of ReLU and the hinge,
      // and valid probabilities for the logarithmic losses.
      {"type: RELU", x, 1, 1e-3f},
      {"type: SIGMOID", x, 1, 1e-3f},
      {"type: TANH", x, 1, 1e-3f},
      {"type: BNLL", x, 1, 1e-3f},
      {"type: POWER power_param { power: 2 scale: 0.7 shift: 0.4 }", x, 1, 1e-3f},
      {"type: POWER power_param { power: 1.5 scale: 0.5 }", x, 1, 1e-3f},
      {"type: POWER power_param { power: 1 scale: 2 shift: 1 }", x, 1, 1e-3f},
      {"type: POOLING pooling_param { kernel_size: 3 stride: 2 }", im, 1, 1e-3f},
      {"type: POOLING pooling_param { pool: AVE kernel_size: 3 pad: 1 stride: 2 }", im, 1, 1e-3f},
      // Odd and even windows across channels, and one within a channel.
      {"type: LRN lrn_param { local_size: 4 alpha: 0.5 }", {{2, 7, 3, 2}}, 1, 1e-2f},
      {"type: LRN lrn_param { local_size: 3 alpha: 0.5 }", {{2, 7, 3, 2}}, 1, 1e-2f},
      {"type: LRN lrn_param { local_size: 3 alpha: 2 norm_region: WITHIN_CHANNEL }",
       {{1, 2, 4, 5}}, 1, 1e-2f},
      {"type: CONVOLUTION convolution_param { num_output: 4 kernel_size: 3 pad: 1 stride: 2 "
       "group: 2 " + filled + "}", {{2, 4, 5, 6}}, 1, 1e-2f},
      {"type: INNER_PRODUCT inner_product_param { num_output: 3 " + filled + "}", x, 1, 1e-2f},
      // Normalised for the first image only; later ones keep exp(x - max).
      {"type: SOFTMAX", {{2, 3, 2, 3}}, 1, 1e-3f},
      {"type: CONCAT", {{1, 2, 1, 2}, {1, 1, 1, 2}}, 1, 1e-2f},
      {"type: CONCAT concat_param { concat_dim: 0 }", {{1, 2, 1, 2}, {2, 2, 1, 2}}, 1, 1e-2f},
      {"type: SPLIT", p, 2, 1e-2f},
      {"type: ELTWISE_PRODUCT", {{2, 3, 2, 1}, {2, 3, 2, 1}, {2, 3, 2, 1}}, 1, 1e-2f},
      {"type: IM2COL convolution_param { kernel_size: 3 pad: 1 stride: 2 }", im, 1, 1e-2f},
      {"type: EUCLIDEAN_LOSS", {{2, 3, 2, 1}, {2, 3, 2, 1}}, 0, 1e-3f},
      {"type: SIGMOID_CROSS_ENTROPY_LOSS", {{2, 3, 2, 1}, {2, 3, 2, 1}}, 0, 1e-3f},
      {"type: HINGE_LOSS", p, 0, 1e-3f, {4.5f, 1}},
      {"type: MULTINOMIAL_LOGISTIC_LOSS", p, 0, 1e-3f, {4.5f, 1}},
      {Infogain(dir, 6, gains), p, 0, 1e-3f, {4.5f, 1}},
      // A true softmax only for the first image, so one image.
      {"type: SOFTMAX_LOSS", {{1, 5, 1, 1}}, 0, 1e-2f, {3}},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.layer);
    LayerBlobs blobs(c.bottoms, c.tops, c.labels);
    const auto layer = Make(c.layer);
    layer->SetUp(blobs.bottom, &blobs.top);
    layer->UpdateOffsets();  // a grouped convolution's strides come with its weights
    CheckGradient(layer.get(), blobs.bottom, &blobs.top, c.step);
  }
}

TEST(LayerDeathTest, SetUpRefusesWhatALayerCannotTake) {
  TempDir dir;
  const std::vector<std::vector<int>> one = {{1, 3, 5, 5}};
  const std::vector<std::vector<int>> two = {{1, 3, 5, 5}, {1, 3, 5, 5}};
  const std::vector<std::vector<int>> unequal = {{1, 2, 3, 3}, {1, 1, 2, 3}};
  const std::vector<std::vector<int>> p = {{2, 3, 1, 1}};
  const std::string conv = "type: CONVOLUTION convolution_param { kernel_size: 3 ";
  const struct {
    std::string layer;
    std::vector<std::vector<int>> bottoms;
    int tops;
    std::string words;
    std::vector<float> labels = {};
  } cases[] = {
      {conv + "num_output: 1 }", two, 1, "Conv Layer takes a single blob as input."},
      {conv + "}", one, 1, "Check failed: num_output_ > 0 "},
      {conv + "num_output: 2 group: 2 }", one, 1, "Check failed: channels_ % group_ == 0 "},
      {conv + "num_output: 3 group: 2 }", {{1, 4, 5, 5}}, 1,
       "Number of output should be multiples of group."},
      {"type: POOLING pooling_param { kernel_size: 2 pad: 1 }", one, 1,
       "Padding implemented only for average pooling."},
      {"type: RELU", two, 1, "Neuron Layer takes a single blob as input."},
      {"type: RELU", one, 2, "Neuron Layer takes a single blob as output."},
      {"type: SOFTMAX", {{1, 1, 2, 2}}, 1, "Softmax Layer takes more than two-channels output."},
      {"type: INNER_PRODUCT", two, 1, "IP Layer takes a single blob as input."},
      {"type: CONCAT", one, 1, "Concat Layer takes at least two blobs as input."},
      {"type: CONCAT concat_param { concat_dim: 2 }", unequal, 1,
       "For now concat_dim <=1, it can only concat num and channels"},
      {"type: CONCAT", unequal, 1, "Check failed: count_ == \\(\\*top\\)\\[0\\]->count\\(\\) "},
      {"type: ELTWISE_PRODUCT", unequal, 1, "channels == bottom\\[i\\]->channels\\(\\)"},
      {"type: EUCLIDEAN_LOSS", p, 0, "Loss Layer takes two blobs as input."},
      {"type: HINGE_LOSS", p, 1, "Loss Layer takes no output.", {0, 1}},
      {"type: HINGE_LOSS", p, 0, "The data and label should have the same number.", {0, 1, 2}},
      {"type: SIGMOID_CROSS_ENTROPY_LOSS", p, 0,
       "SigmoidCrossEntropyLoss Layer inputs must have same count.", {0, 1}},
      {"type: SOFTMAX_LOSS", p, 0, "SoftmaxLoss Layer takes two blobs as input."},
      {"type: ACCURACY", p, 0, "Accuracy Layer takes 1 output.", {0, 1}},
      {Infogain(dir, 4, std::vector<float>(16)), p, 0, "infogain_.height\\(\\) == dim", {0, 1}},
  };
  for (const auto& c : cases) {
    LayerBlobs blobs(c.bottoms, c.tops, c.labels);
    EXPECT_DEATH(Make(c.layer)->SetUp(blobs.bottom, &blobs.top), c.words) << c.layer;
  }
  LayerBlobs in_place(one, 1);
  in_place.top.push_back(in_place.bottom[0]);
  EXPECT_DEATH(Make("type: SPLIT")->SetUp(in_place.bottom, &in_place.top),
               "Only 0th top blob may be in place.");
  Blob<float> four(1, 4, 5, 5);
  EXPECT_DEATH(static_cast<ConvolutionLayer<float>*>(
                   OneLayer(conv + "num_output: 2 group: 2 }", &four).layer.get())
                   ->CheckBinarization(),
               "binarization supports only single group.");
  EXPECT_DEATH(OneLayer("type: POOLING pooling_param { pool: STOCHASTIC kernel_size: 2 }",
                        in_place.bottom[0]).Forward(),
               "Not Implemented Yet");
}

TEST(LossLayersTest, LossValuesMatchHandComputedOnes) {
  TempDir dir;
  const struct {
    std::string layer;
    int num;
    std::vector<float> p, t;
    double loss;
  } cases[] = {
      // (1 + 4) / 2 images * 0.5.
      {"type: EUCLIDEAN_LOSS", 2, {1, 2, 3, 4}, {0, 2, 5, 4}, 1.25},
      // -t log s(p) - (1 - t) log(1 - s(p)), s the sigmoid: 0.474077 + 0.313262 + 1.548587 + 20.
      {"type: SIGMOID_CROSS_ENTROPY_LOSS", 2, {0.5f, -1, 3, -20}, {1, 0, 0.5f, 1}, 22.335926 / 2},
      // Margins 1 - 0.5, 0, 1 + 3 and 1 + 1, 1 + 0.2, 1 - (-0.5).
      {"type: HINGE_LOSS", 2, {0.5f, -2, 3, 1, 0.2f, -0.5f}, {0, 2}, (4.5 + 4.7) / 2},
      // A label of 1.7 reads class 1; a probability of 0 costs -log(1e-20).
      {"type: MULTINOMIAL_LOGISTIC_LOSS", 2, {0.2f, 0.5f, 0.3f, 0, 0.9f, 0.1f}, {1.7f, 0},
       (-std::log(0.5) + 46.0517) / 2},
      {Infogain(dir, 3, {1, 0, 0, 0, 2, 0, 0.5f, 0, 1}), 2, {0.2f, 0.5f, 0.3f, 0.1f, 0.6f, 0.3f},
       {2, 1}, -(0.5 * std::log(0.2) + std::log(0.3) + 2 * std::log(0.6)) / 2},
      // -log(e / (e + e^2 + e^3)).
      {"type: SOFTMAX_LOSS", 1, {1, 2, 3}, {0}, 2.4076060},
      // exp(-200) underflows to a probability of exactly 0, which is floored
      // at the smallest normal float, far lower than in the other losses.
      {"type: SOFTMAX_LOSS", 1, {0, -200, 0}, {1}, 87.336545},
  };
  for (const auto& c : cases) {
    Blob<float> p(c.num, static_cast<int>(c.p.size()) / c.num, 1, 1);
    Blob<float> t(c.num, static_cast<int>(c.t.size()) / c.num, 1, 1);
    SetValues(&p, c.p);
    SetValues(&t, c.t);
    Blobs bottom = {&p, &t};
    Blobs no_top;
    const auto layer = Make(c.layer);
    layer->SetUp(bottom, &no_top);
    EXPECT_NEAR(layer->Forward(bottom, &no_top), c.loss, 1e-5 * std::max(1.0, c.loss)) << c.layer;
  }
}

TEST(AccuracyLayerTest, CountsArgmaxHitsAndAveragesTheLogLoss) {
  Blob<float> scores(4, 3, 1, 1);
  Blob<float> labels(4, 1, 1, 1);
  Blob<float> out;
  // A hit; a tie won by index 0, missing label 1; a hit on a truncated label
  // 2.9; all negative scores, won by index 1, whose log is floored.
  SetValues(&scores, {0.2f, 0.5f, 0.3f, 0.4f, 0.4f, 0.2f, 0.1f, 0.1f, 0.8f, -5, -3, -4});
  SetValues(&labels, {1, 1, 2.9f, 1});
  Blobs bottom = {&scores, &labels};
  Blobs top = {&out};
  AccuracyLayer<float> layer{LayerParameter()};
  layer.SetUp(bottom, &top);
  EXPECT_EQ(layer.Forward(bottom, &top), 0.0f);
  ASSERT_EQ(out.count(), 2);
  EXPECT_FLOAT_EQ(out.cpu_data()[0], 0.75f);
  EXPECT_NEAR(out.cpu_data()[1],
              -(std::log(0.5) + std::log(0.4) + std::log(0.8) + std::log(1e-20)) / 4, 1e-5);
  EXPECT_DEATH(layer.Backward(top, true, &bottom), "Not Implemented Yet");
}

}  // namespace
}  // namespace nn
