#include "nn/loss_layers.h"

#include <gtest/gtest.h>

#include <cmath>
#include <memory>
#include <string>
#include <vector>

#include "blob_proto_maker.h"
#include "gradient_checker.h"
#include "nn/util/io.h"
#include "temp_dir.h"

namespace nn {
namespace {

std::unique_ptr<Layer<float>> Make(const std::string& text) {
  return std::unique_ptr<Layer<float>>(GetLayer<float>(Parse<LayerParameter>(text)));
}

TEST(LossLayersTest, LossValuesMatchHandComputedOnes) {
  TempDir dir;
  const std::string infogain = "type: INFOGAIN_LOSS infogain_loss_param { source: '" +
                               dir.path() + "/gains' }";
  ASSERT_TRUE(WriteProtoToBinaryFile(MakeBlob(1, 1, 3, 3, {1, 0, 0, 0, 2, 0, 0.5f, 0, 1}),
                                     dir.path() + "/gains"));
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
      {infogain, 2, {0.2f, 0.5f, 0.3f, 0.1f, 0.6f, 0.3f}, {2, 1},
       -(0.5 * std::log(0.2) + std::log(0.3) + 2 * std::log(0.6)) / 2},
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
  EXPECT_EQ(out.count(), 2);
  EXPECT_FLOAT_EQ(out.cpu_data()[0], 3.0f / 4);
  EXPECT_NEAR(out.cpu_data()[1],
              -(std::log(0.5) + std::log(0.4) + std::log(0.8) + std::log(1e-20)) / 4, 1e-5);
  EXPECT_DEATH(layer.Backward(top, true, &bottom), "Not Implemented Yet");
}

TEST(LossLayersDeathTest, SetUpRefusesBadBottomsTopsAndMatrices) {
  Blob<float> p(2, 3, 1, 1);
  Blob<float> labels(2, 1, 1, 1);
  Blob<float> three(3, 1, 1, 1);
  Blob<float> out;
  TempDir dir;
  ASSERT_TRUE(WriteProtoToBinaryFile(MakeBlob(1, 1, 4, 4, std::vector<float>(16)),
                                     dir.path() + "/gains"));
  const struct {
    std::string layer;
    Blobs bottom, top;
    const char* message;
  } cases[] = {
      {"type: EUCLIDEAN_LOSS", {&p}, {},
       "Check failed: bottom.size\\(\\) == 2 \\(1 vs. 2\\) Loss Layer takes two blobs as input."},
      {"type: HINGE_LOSS", {&p, &labels}, {&out},
       "Check failed: top->size\\(\\) == 0 .*Loss Layer takes no output."},
      {"type: HINGE_LOSS", {&p, &three}, {},
       "Check failed: bottom\\[0\\]->num\\(\\) == bottom\\[1\\]->num\\(\\) .*The data and label "
       "should have the same number."},
      {"type: SIGMOID_CROSS_ENTROPY_LOSS", {&p, &labels}, {},
       "SigmoidCrossEntropyLoss Layer inputs must have same count."},
      {"type: SOFTMAX_LOSS", {&p}, {},
       "Check failed: bottom.size\\(\\) == 2 .*SoftmaxLoss Layer takes two blobs as input."},
      {"type: ACCURACY", {&p, &labels}, {},
       "Check failed: top->size\\(\\) == 1 .*Accuracy Layer takes 1 output."},
      {"type: INFOGAIN_LOSS infogain_loss_param { source: '" + dir.path() + "/gains' }",
       {&p, &labels}, {}, "Check failed: infogain_.height\\(\\) == dim \\(4 vs. 3\\)"},
  };
  for (const auto& c : cases) {
    Blobs top = c.top;
    EXPECT_DEATH(Make(c.layer)->SetUp(c.bottom, &top), c.message);
  }
}

}  // namespace
}  // namespace nn
