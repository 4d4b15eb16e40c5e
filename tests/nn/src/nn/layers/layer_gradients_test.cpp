#include <gtest/gtest.h>

#include <memory>
#include <string>
#include <vector>

#include "blob_proto_maker.h"
#include "gradient_checker.h"
#include "nn/util/io.h"
#include "temp_dir.h"

namespace nn {
namespace {

TEST(LayerGradientTest, BackwardMatchesFiniteDifferencesForEveryLayerType) {
  TempDir dir;
  std::vector<float> gains(36);
  for (int i = 0; i < 36; ++i) {
    gains[i] = static_cast<float>((i * 7) % 5) / 4;
  }
  ASSERT_TRUE(WriteProtoToBinaryFile(MakeBlob(1, 1, 6, 6, gains), dir.path() + "/gains"));
  const std::string filled =
      "weight_filler { type: 'uniform' min: -1 max: 1 } bias_filler { type: 'uniform' } ";
  const struct {
    std::string layer;
    std::vector<std::vector<int>> bottoms;
    int tops;
    float step;
    std::vector<float> labels = {};  // a last bottom of one label an image
  } cases[] = {
      // Inputs are drawn from [0.1, 0.9]: away from the kinks of ReLU and the
      // hinge, and valid probabilities for the logarithmic losses.
      {"type: RELU", {{2, 3, 2, 2}}, 1, 1e-3f},
      {"type: SIGMOID", {{2, 3, 2, 2}}, 1, 1e-3f},
      {"type: TANH", {{2, 3, 2, 2}}, 1, 1e-3f},
      {"type: BNLL", {{2, 3, 2, 2}}, 1, 1e-3f},
      {"type: POWER power_param { power: 2 scale: 0.7 shift: 0.4 }", {{2, 3, 2, 2}}, 1, 1e-3f},
      {"type: POWER power_param { power: -0.75 scale: 0.3 shift: 1 }", {{2, 3, 2, 2}}, 1, 1e-3f},
      {"type: POWER power_param { power: 1.5 scale: 0.5 }", {{2, 3, 2, 2}}, 1, 1e-3f},
      {"type: POWER power_param { power: 1 scale: 2 shift: 1 }", {{2, 3, 2, 2}}, 1, 1e-3f},
      {"type: POOLING pooling_param { kernel_size: 3 stride: 2 }", {{2, 2, 7, 6}}, 1, 1e-3f},
      {"type: POOLING pooling_param { pool: AVE kernel_size: 3 stride: 2 pad: 1 }", {{2, 2, 7, 6}},
       1, 1e-3f},
      // Odd, even and small windows across channels, and one within a channel.
      {"type: LRN lrn_param { local_size: 9 alpha: 0.5 }", {{2, 7, 3, 2}}, 1, 1e-2f},
      {"type: LRN lrn_param { local_size: 4 alpha: 0.5 }", {{2, 7, 3, 2}}, 1, 1e-2f},
      {"type: LRN lrn_param { local_size: 3 alpha: 0.5 }", {{2, 7, 3, 2}}, 1, 1e-2f},
      {"type: LRN lrn_param { local_size: 3 alpha: 2 norm_region: WITHIN_CHANNEL }",
       {{1, 2, 4, 5}}, 1, 1e-2f},
      {"type: CONVOLUTION convolution_param { num_output: 4 kernel_size: 3 pad: 1 stride: 2 "
       "group: 2 " + filled + "}", {{2, 4, 5, 6}}, 1, 1e-2f},
      {"type: INNER_PRODUCT inner_product_param { num_output: 3 " + filled + "}", {{2, 1, 2, 2}},
       1, 1e-2f},
      // Normalised for the first image only; later ones keep exp(x - max).
      {"type: SOFTMAX", {{2, 3, 2, 3}}, 1, 1e-3f},
      {"type: CONCAT", {{1, 2, 1, 2}, {1, 1, 1, 2}}, 1, 1e-2f},
      {"type: CONCAT concat_param { concat_dim: 0 }", {{1, 2, 1, 2}, {2, 2, 1, 2}}, 1, 1e-2f},
      {"type: SPLIT", {{2, 3, 2, 1}}, 2, 1e-2f},
      {"type: ELTWISE_PRODUCT", {{2, 3, 2, 1}, {2, 3, 2, 1}, {2, 3, 2, 1}}, 1, 1e-2f},
      {"type: IM2COL convolution_param { kernel_size: 3 pad: 1 stride: 2 }", {{2, 2, 4, 5}}, 1,
       1e-2f},
      {"type: EUCLIDEAN_LOSS", {{2, 3, 2, 1}, {2, 3, 2, 1}}, 0, 1e-3f},
      {"type: SIGMOID_CROSS_ENTROPY_LOSS", {{2, 3, 2, 1}, {2, 3, 2, 1}}, 0, 1e-3f},
      {"type: HINGE_LOSS", {{2, 3, 2, 1}}, 0, 1e-3f, {4.5f, 1}},
      {"type: MULTINOMIAL_LOGISTIC_LOSS", {{2, 3, 2, 1}}, 0, 1e-3f, {4.5f, 1}},
      {"type: INFOGAIN_LOSS infogain_loss_param { source: '" + dir.path() + "/gains' }",
       {{2, 3, 2, 1}}, 0, 1e-3f, {4.5f, 1}},
      // A true softmax only for the first image, so one image.
      {"type: SOFTMAX_LOSS", {{1, 5, 1, 1}}, 0, 1e-2f, {3}},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.layer);
    std::vector<std::unique_ptr<Blob<float>>> blobs;
    Blobs bottom;
    Blobs top;
    for (const auto& shape : c.bottoms) {
      blobs.emplace_back(new Blob<float>(shape[0], shape[1], shape[2], shape[3]));
      FillUniform(blobs.back().get(), 0.1f, 0.9f, static_cast<unsigned>(blobs.size()));
      bottom.push_back(blobs.back().get());
    }
    if (!c.labels.empty()) {
      blobs.emplace_back(new Blob<float>(static_cast<int>(c.labels.size()), 1, 1, 1));
      SetValues(blobs.back().get(), c.labels);
      bottom.push_back(blobs.back().get());
    }
    for (int t = 0; t < c.tops; ++t) {
      blobs.emplace_back(new Blob<float>());
      top.push_back(blobs.back().get());
    }
    std::unique_ptr<Layer<float>> layer(GetLayer<float>(Parse<LayerParameter>(c.layer)));
    layer->SetUp(bottom, &top);
    layer->UpdateOffsets();  // a grouped convolution's strides come with its weights
    CheckGradient(layer.get(), bottom, &top, c.step);
  }
}

}  // namespace
}  // namespace nn
