#include "nn/loss_layers.h"

#include <gtest/gtest.h>

#include <algorithm>
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

using Blobs = std::vector<Blob<float>*>;

template <typename LayerType>
std::shared_ptr<Layer<float>> Make(const LayerParameter& param = LayerParameter()) {
  return std::make_shared<LayerType>(param);
}

void Set(Blob<float>* blob, const std::vector<float>& values) {
  ASSERT_EQ(blob->count(), static_cast<int>(values.size()));
  std::copy(values.begin(), values.end(), blob->mutable_cpu_data());
}

// Sets a loss layer up on (p, t) and returns its forward result.
float Loss(Layer<float>* layer, Blob<float>* p, Blob<float>* t) {
  Blobs bottom = {p, t};
  Blobs no_top;
  layer->SetUp(bottom, &no_top);
  return layer->Forward(bottom, &no_top);
}

// A loss layer has no top to weigh, so its backward pass is compared with
// central differences of the loss itself, over the first bottom.
void CheckLossGradient(Layer<float>* layer, Blob<float>* p, Blob<float>* t, float step) {
  Loss(layer, p, t);
  Blobs bottom = {p, t};
  Blobs no_top;
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
    EXPECT_NEAR(analytic[k], numeric, 1e-2 * scale) << "element " << k;
  }
}

LayerParameter Infogain(const TempDir& dir, int size, const std::vector<float>& matrix) {
  LayerParameter param;
  param.mutable_infogain_loss_param()->set_source(dir.path() + "/infogain");
  EXPECT_TRUE(WriteProtoToBinaryFile(MakeBlob(1, 1, size, size, matrix), dir.path() + "/infogain"));
  return param;
}

TEST(LossLayersTest, LossValuesMatchHandComputedOnes) {
  TempDir dir;
  const struct {
    std::shared_ptr<Layer<float>> layer;
    int num;
    std::vector<float> p, t;
    double loss;
  } cases[] = {
      // (1 + 4) / 2 images * 0.5.
      {Make<EuclideanLossLayer<float>>(), 2, {1, 2, 3, 4}, {0, 2, 5, 4}, 1.25},
      // -t log s(p) - (1 - t) log(1 - s(p)), s the sigmoid: 0.474077 + 0.313262 + 1.548587 + 20.
      {Make<SigmoidCrossEntropyLossLayer<float>>(), 2, {0.5f, -1, 3, -20}, {1, 0, 0.5f, 1},
       22.335926 / 2},
      // Margins 1 - 0.5, 0, 1 + 3 and 1 + 1, 1 + 0.2, 1 - (-0.5).
      {Make<HingeLossLayer<float>>(), 2, {0.5f, -2, 3, 1, 0.2f, -0.5f}, {0, 2}, (4.5 + 4.7) / 2},
      // A label of 1.7 reads class 1; a probability of 0 costs -log(1e-20).
      {Make<MultinomialLogisticLossLayer<float>>(), 2, {0.2f, 0.5f, 0.3f, 0, 0.9f, 0.1f}, {1.7f, 0},
       (-std::log(0.5) + 46.0517) / 2},
      {Make<InfogainLossLayer<float>>(Infogain(dir, 3, {1, 0, 0, 0, 2, 0, 0.5f, 0, 1})), 2,
       {0.2f, 0.5f, 0.3f, 0.1f, 0.6f, 0.3f}, {2, 1},
       -(0.5 * std::log(0.2) + std::log(0.3) + 2 * std::log(0.6)) / 2},
      // -log(e / (e + e^2 + e^3)).
      {Make<SoftmaxWithLossLayer<float>>(), 1, {1, 2, 3}, {0}, 2.4076060},
      // exp(-200) underflows to a probability of exactly 0, which is floored
      // at the smallest normal float, far lower than in the other losses.
      {Make<SoftmaxWithLossLayer<float>>(), 1, {0, -200, 0}, {1}, 87.336545},
  };
  for (const auto& c : cases) {
    Blob<float> p(c.num, static_cast<int>(c.p.size()) / c.num, 1, 1);
    Blob<float> t(c.num, static_cast<int>(c.t.size()) / c.num, 1, 1);
    Set(&p, c.p);
    Set(&t, c.t);
    EXPECT_NEAR(Loss(c.layer.get(), &p, &t), c.loss, 1e-5 * std::max(1.0, c.loss))
        << "case " << &c - cases;
  }
}

TEST(LossLayersTest, BackwardMatchesFiniteDifferences) {
  Blob<float> p(2, 3, 2, 1);
  Blob<float> t(2, 3, 2, 1);
  Blob<float> labels(2, 1, 1, 1);
  FillUniform(&t, 0, 1, 4);
  Set(&labels, {4.5f, 1});
  std::vector<float> gains(36);
  for (int i = 0; i < 36; ++i) {
    gains[i] = static_cast<float>((i * 7) % 5) / 4;
  }
  TempDir dir;
  const struct {
    std::shared_ptr<Layer<float>> layer;
    Blob<float>* t;
  } cases[] = {{Make<EuclideanLossLayer<float>>(), &t},
               {Make<SigmoidCrossEntropyLossLayer<float>>(), &t},
               {Make<HingeLossLayer<float>>(), &labels},
               {Make<MultinomialLogisticLossLayer<float>>(), &labels},
               {Make<InfogainLossLayer<float>>(Infogain(dir, 6, gains)), &labels}};
  for (const auto& c : cases) {
    // Probabilities for the logarithmic losses, away from the hinges at +-1.
    FillUniform(&p, 0.1f, 0.9f, 5);
    CheckLossGradient(c.layer.get(), &p, c.t, 1e-3f);
  }
  // A true softmax only for the first image, so one image.
  Blob<float> logits(1, 5, 1, 1);
  FillUniform(&logits, -2, 2, 6);
  Blob<float> label(1, 1, 1, 1);
  Set(&label, {3});
  CheckLossGradient(Make<SoftmaxWithLossLayer<float>>().get(), &logits, &label, 1e-2f);
}

TEST(AccuracyLayerTest, CountsArgmaxHitsAndAveragesTheLogLoss) {
  Blob<float> scores(4, 3, 1, 1);
  Blob<float> labels(4, 1, 1, 1);
  Blob<float> out;
  // A hit; a tie won by index 0, missing label 1; a hit on a truncated label
  // 2.9; all negative scores, won by index 1, whose log is floored.
  Set(&scores, {0.2f, 0.5f, 0.3f, 0.4f, 0.4f, 0.2f, 0.1f, 0.1f, 0.8f, -5, -3, -4});
  Set(&labels, {1, 1, 2.9f, 1});
  Blobs bottom = {&scores, &labels};
  Blobs top = {&out};
  AccuracyLayer<float> layer{LayerParameter()};
  layer.SetUp(bottom, &top);
  EXPECT_EQ(out.count(), 2);
  EXPECT_EQ(layer.Forward(bottom, &top), 0.0f);
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
  const struct {
    std::shared_ptr<Layer<float>> layer;
    Blobs bottom, top;
    const char* message;
  } cases[] = {
      {Make<EuclideanLossLayer<float>>(), {&p}, {},
       "Check failed: bottom.size\\(\\) == 2 \\(1 vs. 2\\) Loss Layer takes two blobs as input."},
      {Make<HingeLossLayer<float>>(), {&p, &labels}, {&out},
       "Check failed: top->size\\(\\) == 0 .*Loss Layer takes no output."},
      {Make<HingeLossLayer<float>>(), {&p, &three}, {},
       "Check failed: bottom\\[0\\]->num\\(\\) == bottom\\[1\\]->num\\(\\) .*The data and label "
       "should have the same number."},
      {Make<SigmoidCrossEntropyLossLayer<float>>(), {&p, &labels}, {},
       "SigmoidCrossEntropyLoss Layer inputs must have same count."},
      {Make<SoftmaxWithLossLayer<float>>(), {&p}, {},
       "Check failed: bottom.size\\(\\) == 2 .*SoftmaxLoss Layer takes two blobs as input."},
      {Make<AccuracyLayer<float>>(), {&p, &labels}, {},
       "Check failed: top->size\\(\\) == 1 .*Accuracy Layer takes 1 output."},
      {Make<InfogainLossLayer<float>>(Infogain(dir, 4, std::vector<float>(16))), {&p, &labels}, {},
       "Check failed: infogain_.height\\(\\) == dim \\(4 vs. 3\\)"},
  };
  for (const auto& c : cases) {
    Blobs top = c.top;
    EXPECT_DEATH(c.layer->SetUp(c.bottom, &top), c.message);
  }
}

}  // namespace
}  // namespace nn
