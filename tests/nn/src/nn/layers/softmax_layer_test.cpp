#include <gtest/gtest.h>

#include <cmath>
#include <vector>

#include "gradient_checker.h"

namespace nn {
namespace {

TEST(SoftmaxLayerTest, NormalisesEachPositionOfTheFirstImageOnly) {
  // Logits are logarithms of these, channel by channel: the first image has
  // 1, 2, 5 at its first position and 3, 3, 2 at its second, each summing to 8;
  // the second image's maximum is 8 too, but its positions sum to 7 and 11.
  const std::vector<float> e = {1, 3, 2, 3, 5, 2, 1, 8, 4, 2, 2, 1};
  Blob<float> in(2, 3, 1, 2);
  for (int i = 0; i < 12; ++i) {
    in.mutable_cpu_data()[i] = std::log(e[i]);
  }
  const std::vector<float> out = OneLayer("type: SOFTMAX", &in).Forward();
  for (int i = 0; i < 12; ++i) {
    EXPECT_NEAR(out[i], e[i] / 8, 1e-6) << i;
  }

  // One maximum for the whole image: the second position lies 200 below it,
  // so its exponentials underflow and give 0 / 0.
  Blob<float> far(1, 2, 1, 2);
  SetValues(&far, {0, -200, 1, -199});
  const std::vector<float> probs = OneLayer("type: SOFTMAX", &far).Forward();
  EXPECT_NEAR(probs[2], 1 / (1 + std::exp(-1.0)), 1e-6);
  EXPECT_TRUE(std::isnan(probs[1]));
}

TEST(SoftmaxLayerTest, AlterInputShapeToANonSquareMap) {
  Blob<float> in(1, 2, 3, 4);
  OneLayer softmax("type: SOFTMAX", &in);
  in.RewriteShape(1, 2, 2, 3);
  FillUniform(&in, -1, 1);
  softmax.layer->AlterInputShape(3, 2, softmax.bottom, &softmax.top);
  const std::vector<float> out = softmax.Forward();
  ASSERT_EQ(out.size(), 12u);
  for (int p = 0; p < 6; ++p) {
    EXPECT_NEAR(out[p] + out[6 + p], 1.0f, 1e-6) << p;
  }
}

TEST(SoftmaxLayerDeathTest, OneChannelIsRefused) {
  Blob<float> in(1, 1, 2, 2);
  EXPECT_DEATH(OneLayer("type: SOFTMAX", &in),
               "channels\\(\\) >= 2 .*Softmax Layer takes more than two-channels output.");
}

}  // namespace
}  // namespace nn
