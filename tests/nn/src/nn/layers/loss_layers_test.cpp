#include "nn/loss_layers.h"

#include <google/protobuf/text_format.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <cstring>
#include <limits>
#include <memory>
#include <string>
#include <vector>

#include "blob_proto_maker.h"
#include "gradient_checker.h"
#include "nn/net.h"
#include "nn/util/io.h"
#include "temp_dir.h"

namespace nn {
namespace {

void Set(Blob<float>* blob, const std::vector<float>& values) {
  ASSERT_EQ(blob->count(), static_cast<int>(values.size()));
  std::copy(values.begin(), values.end(), blob->mutable_cpu_data());
}

// Sets a loss layer up on (p, t) and returns its forward result.
float Loss(Layer<float>* layer, Blob<float>* p, Blob<float>* t) {
  std::vector<Blob<float>*> bottom = {p, t};
  std::vector<Blob<float>*> no_top;
  layer->SetUp(bottom, &no_top);
  return layer->Forward(bottom, &no_top);
}

// A loss layer has no top to weigh, so its backward pass is compared with
// central differences of the loss itself, over the first bottom.
void CheckLossGradient(Layer<float>* layer, Blob<float>* p, Blob<float>* t, float step,
                       float tolerance) {
  std::vector<Blob<float>*> bottom = {p, t};
  std::vector<Blob<float>*> no_top;
  layer->SetUp(bottom, &no_top);
  layer->Forward(bottom, &no_top);
  layer->Backward(no_top, true, &bottom);
  const std::vector<float> analytic(p->cpu_diff(), p->cpu_diff() + p->count());
  float* data = p->mutable_cpu_data();
  for (int k = 0; k < p->count(); ++k) {
    const float original = data[k];
    data[k] = original + step;
    const double plus = layer->Forward(bottom, &no_top);
    data[k] = original - step;
    const double minus = layer->Forward(bottom, &no_top);
    data[k] = original;
    const double numeric = (plus - minus) / (2.0 * step);
    const double scale = std::max({1.0, std::fabs(numeric), std::fabs(double(analytic[k]))});
    EXPECT_NEAR(analytic[k], numeric, tolerance * scale) << "element " << k;
  }
}

std::string WriteMatrix(const TempDir& dir, int size, const std::vector<float>& values) {
  const std::string path = dir.path() + "/infogain";
  EXPECT_TRUE(WriteProtoToBinaryFile(MakeBlob(1, 1, size, size, values), path));
  return path;
}

LayerParameter InfogainParam(const std::string& source) {
  LayerParameter param;
  param.mutable_infogain_loss_param()->set_source(source);
  return param;
}

TEST(LossLayersTest, LossValuesMatchHandComputedOnes) {
  Blob<float> p(2, 2, 1, 1);
  Blob<float> t(2, 2, 1, 1);
  Set(&p, {1, 2, 3, 4});
  Set(&t, {0, 2, 5, 4});
  EuclideanLossLayer<float> euclidean{LayerParameter()};
  // (1 + 4) / 2 images * 0.5.
  EXPECT_FLOAT_EQ(Loss(&euclidean, &p, &t), 1.25f);

  Blob<float> scores(2, 3, 1, 1);
  Blob<float> labels(2, 1, 1, 1);
  Set(&scores, {0.5f, -2, 3, 1, 0.2f, -0.5f});
  Set(&labels, {0, 2});
  HingeLossLayer<float> hinge{LayerParameter()};
  // Margins 1 - 0.5, 0, 1 + 3 and 1 + 1, 1 + 0.2, 1 - (-0.5).
  EXPECT_FLOAT_EQ(Loss(&hinge, &scores, &labels), (4.5f + 4.7f) / 2);
  const std::vector<float> margins = {0.5f, 0, 4, 2, 1.2f, 1.5f};
  for (int i = 0; i < 6; ++i) {
    EXPECT_FLOAT_EQ(scores.cpu_diff()[i], margins[i]) << "forward keeps its margins, " << i;
  }

  // A label of 1.7 reads class 1; a probability of 0 costs -log(1e-20).
  Set(&scores, {0.2f, 0.5f, 0.3f, 0, 0.9f, 0.1f});
  Set(&labels, {1.7f, 0});
  MultinomialLogisticLossLayer<float> multinomial{LayerParameter()};
  EXPECT_FLOAT_EQ(Loss(&multinomial, &scores, &labels), (-std::log(0.5f) + 46.0517f) / 2);

  TempDir dir;
  const std::string matrix = WriteMatrix(dir, 3, {1, 0, 0, 0, 2, 0, 0.5f, 0, 1});
  Set(&scores, {0.2f, 0.5f, 0.3f, 0.1f, 0.6f, 0.3f});
  Set(&labels, {2, 1});
  InfogainLossLayer<float> infogain(InfogainParam(matrix));
  EXPECT_NEAR(Loss(&infogain, &scores, &labels),
              -(0.5 * std::log(0.2) + std::log(0.3) + 2 * std::log(0.6)) / 2, 1e-6);

  Set(&p, {0.5f, -1, 3, -20});
  Set(&t, {1, 0, 0.5f, 1});
  double cross_entropy = 0;
  for (int i = 0; i < 4; ++i) {
    const double x = p.cpu_data()[i];
    const double target = t.cpu_data()[i];
    const double sigmoid = 1 / (1 + std::exp(-x));
    cross_entropy -= target * std::log(sigmoid) + (1 - target) * std::log(1 - sigmoid);
  }
  SigmoidCrossEntropyLossLayer<float> sigmoid_loss{LayerParameter()};
  EXPECT_NEAR(Loss(&sigmoid_loss, &p, &t), cross_entropy / 2, 1e-5);

  Blob<float> logits(1, 3, 1, 1);
  Blob<float> label(1, 1, 1, 1);
  Set(&logits, {1, 2, 3});
  Set(&label, {0});
  SoftmaxWithLossLayer<float> softmax_loss{LayerParameter()};
  EXPECT_NEAR(Loss(&softmax_loss, &logits, &label),
              -std::log(std::exp(1.0) / (std::exp(1.0) + std::exp(2.0) + std::exp(3.0))), 1e-6);
}

TEST(LossLayersTest, TheSoftmaxLossHasALowerFloorThanTheOthers) {
  uint32_t bits;
  std::memcpy(&bits, &kLOG_THRESHOLD, sizeof(bits));
  EXPECT_EQ(bits, 0x1E3CE508u);

  // exp(-200) underflows: the probability at the label is exactly 0.
  Blob<float> logits(1, 2, 1, 1);
  Blob<float> label(1, 1, 1, 1);
  Set(&logits, {0, -200});
  Set(&label, {1});
  SoftmaxWithLossLayer<float> softmax_loss{LayerParameter()};
  EXPECT_FLOAT_EQ(Loss(&softmax_loss, &logits, &label),
                  -std::log(std::numeric_limits<float>::min()));

  Blob<float> probs(1, 2, 1, 1);
  Set(&probs, {1, 0});
  MultinomialLogisticLossLayer<float> multinomial{LayerParameter()};
  EXPECT_FLOAT_EQ(Loss(&multinomial, &probs, &label), -std::log(kLOG_THRESHOLD));
}

TEST(LossLayersTest, BackwardMatchesFiniteDifferences) {
  Blob<float> p(2, 3, 2, 1);
  Blob<float> t(2, 3, 2, 1);
  FillUniform(&p, -2, 2, 1);
  FillUniform(&t, -2, 2, 2);
  EuclideanLossLayer<float> euclidean{LayerParameter()};
  CheckLossGradient(&euclidean, &p, &t, 1e-2f, 1e-2f);

  // Away from the hinges at +-1.
  FillUniform(&p, -3, 3, 3);
  Blob<float> labels(2, 1, 1, 1);
  Set(&labels, {4.5f, 1});
  HingeLossLayer<float> hinge{LayerParameter()};
  CheckLossGradient(&hinge, &p, &labels, 1e-3f, 1e-2f);

  FillUniform(&t, 0, 1, 4);
  SigmoidCrossEntropyLossLayer<float> sigmoid_loss{LayerParameter()};
  CheckLossGradient(&sigmoid_loss, &p, &t, 1e-2f, 1e-2f);

  FillUniform(&p, 0.1f, 1, 5);
  MultinomialLogisticLossLayer<float> multinomial{LayerParameter()};
  CheckLossGradient(&multinomial, &p, &labels, 1e-3f, 1e-2f);

  TempDir dir;
  std::vector<float> gains(36);
  for (int i = 0; i < 36; ++i) {
    gains[i] = static_cast<float>((i * 7) % 5) / 4;
  }
  InfogainLossLayer<float> infogain(InfogainParam(WriteMatrix(dir, 6, gains)));
  CheckLossGradient(&infogain, &p, &labels, 1e-3f, 1e-2f);

  // A true softmax only for the first image, so one image.
  Blob<float> logits(1, 5, 1, 1);
  Blob<float> label(1, 1, 1, 1);
  FillUniform(&logits, -2, 2, 6);
  Set(&label, {3});
  SoftmaxWithLossLayer<float> softmax_loss{LayerParameter()};
  CheckLossGradient(&softmax_loss, &logits, &label, 1e-2f, 1e-2f);
}

TEST(AccuracyLayerTest, CountsArgmaxHitsAndAveragesTheLogLoss) {
  Blob<float> scores(4, 3, 1, 1);
  Blob<float> labels(4, 1, 1, 1);
  Blob<float> out;
  // A hit; a tie won by index 0, missing label 1; a hit on a truncated label
  // 2.9; all negative scores, won by index 1, whose log is floored.
  Set(&scores, {0.2f, 0.5f, 0.3f, 0.4f, 0.4f, 0.2f, 0.1f, 0.1f, 0.8f, -5, -3, -4});
  Set(&labels, {1, 1, 2.9f, 1});
  std::vector<Blob<float>*> bottom = {&scores, &labels};
  std::vector<Blob<float>*> top = {&out};
  AccuracyLayer<float> layer{LayerParameter()};
  layer.SetUp(bottom, &top);
  EXPECT_EQ(out.num(), 1);
  EXPECT_EQ(out.channels(), 2);
  EXPECT_EQ(out.count(), 2);
  EXPECT_EQ(layer.Forward(bottom, &top), 0.0f);
  EXPECT_FLOAT_EQ(out.cpu_data()[0], 3.0f / 4);
  EXPECT_NEAR(out.cpu_data()[1],
              -(std::log(0.5) + std::log(0.4) + std::log(0.8) + std::log(1e-20)) / 4, 1e-5);
}

TEST(LossLayersTest, LossesSitInANetWithoutOutputs) {
  NetParameter description;
  ASSERT_TRUE(google::protobuf::TextFormat::ParseFromString(R"(
    input: "data" input_dim: 2 input_dim: 3 input_dim: 1 input_dim: 1
    input: "label" input_dim: 2 input_dim: 1 input_dim: 1 input_dim: 1
    layers { name: "softmax" type: SOFTMAX_LOSS bottom: "data" bottom: "label" }
    layers { name: "hinge" type: HINGE_LOSS bottom: "data" bottom: "label" }
    layers { name: "logistic" type: MULTINOMIAL_LOGISTIC_LOSS bottom: "data" bottom: "label" }
    layers { name: "accuracy" type: ACCURACY bottom: "data" bottom: "label" top: "accuracy" }
  )", &description));
  Net<float> net(description);
  Set(net.net_input_blobs()[0], {0.1f, 0.7f, 0.2f, 0.6f, 0.3f, 0.1f});
  Set(net.net_input_blobs()[1], {1, 2});
  ASSERT_EQ(net.output_blobs().size(), 1u);
  EXPECT_EQ(net.Forward()[0]->cpu_data()[0], 0.5f);
}

TEST(LossLayersDeathTest, SetUpRefusesBadBottomsAndTops) {
  Blob<float> p(2, 3, 1, 1);
  Blob<float> labels(2, 1, 1, 1);
  Blob<float> three(3, 1, 1, 1);
  Blob<float> wide_labels(2, 2, 1, 1);
  Blob<float> out;
  using Blobs = std::vector<Blob<float>*>;
  const auto set_up = [](Layer<float>* layer, Blobs bottom, Blobs top) {
    std::unique_ptr<Layer<float>> owned(layer);
    owned->SetUp(bottom, &top);
  };
  const LayerParameter param;
  EXPECT_DEATH(set_up(new EuclideanLossLayer<float>(param), {&p}, {}),
               "Check failed: bottom.size\\(\\) == 2 \\(1 vs. 2\\) Loss Layer takes two blobs as "
               "input.");
  EXPECT_DEATH(set_up(new HingeLossLayer<float>(param), {&p, &labels}, {&out}),
               "Check failed: top->size\\(\\) == 0 .*Loss Layer takes no output.");
  EXPECT_DEATH(set_up(new HingeLossLayer<float>(param), {&p, &three}, {}),
               "Check failed: bottom\\[0\\]->num\\(\\) == bottom\\[1\\]->num\\(\\) .*The data and "
               "label should have the same number.");
  EXPECT_DEATH(set_up(new EuclideanLossLayer<float>(param), {&p, &labels}, {}),
               "Check failed: bottom\\[0\\]->channels\\(\\) == bottom\\[1\\]->channels\\(\\)");
  EXPECT_DEATH(set_up(new MultinomialLogisticLossLayer<float>(param), {&p, &wide_labels}, {}),
               "Check failed: bottom\\[1\\]->channels\\(\\) == 1 ");
  EXPECT_DEATH(set_up(new SigmoidCrossEntropyLossLayer<float>(param), {&p, &labels}, {}),
               "SigmoidCrossEntropyLoss Layer inputs must have same count.");
  EXPECT_DEATH(set_up(new SoftmaxWithLossLayer<float>(param), {&p}, {}),
               "Check failed: bottom.size\\(\\) == 2 .*SoftmaxLoss Layer takes two blobs as input.");
  EXPECT_DEATH(set_up(new SoftmaxWithLossLayer<float>(param), {&p, &labels}, {&out}),
               "Check failed: top->size\\(\\) == 0 .*SoftmaxLoss Layer takes no blob as output.");
  EXPECT_DEATH(set_up(new AccuracyLayer<float>(param), {&p}, {&out}),
               "Accuracy Layer takes two blobs as input.");
  EXPECT_DEATH(set_up(new AccuracyLayer<float>(param), {&p, &labels}, {}),
               "Check failed: top->size\\(\\) == 1 .*Accuracy Layer takes 1 output.");
  EXPECT_DEATH(set_up(new AccuracyLayer<float>(param), {&p, &wide_labels}, {&out}),
               "Check failed: bottom\\[1\\]->channels\\(\\) == 1 ");
  AccuracyLayer<float> accuracy(param);
  Blobs bottom = {&p, &labels};
  Blobs top = {&out};
  accuracy.SetUp(bottom, &top);
  EXPECT_DEATH(accuracy.Backward(top, true, &bottom), "Not Implemented Yet");
}

TEST(LossLayersDeathTest, TheInfogainMatrixMustBeReadableAndFitTheScores) {
  Blob<float> p(2, 4, 1, 1);
  Blob<float> labels(2, 1, 1, 1);
  std::vector<Blob<float>*> bottom = {&p, &labels};
  std::vector<Blob<float>*> no_top;
  TempDir dir;
  const std::string matrix = WriteMatrix(dir, 3, std::vector<float>(9, 1));
  EXPECT_DEATH(InfogainLossLayer<float>(InfogainParam(matrix)).SetUp(bottom, &no_top),
               "Check failed: infogain_.height\\(\\) == dim \\(3 vs. 4\\)");
  const std::string garbage = dir.write("garbage", "\xff\xff\xff");
  EXPECT_DEATH(InfogainLossLayer<float>(InfogainParam(garbage)).SetUp(bottom, &no_top),
               "Check failed: ReadProtoFromBinaryFile\\(filename, proto\\) ");
}

}  // namespace
}  // namespace nn
