#include <gtest/gtest.h>

#include <opencv2/core.hpp>

#include <string>

#include "detector/cascade_loader.h"
#include "detector/image_planes.h"
#include "nn/net.h"
#include "nn/util/io.h"

namespace tavilib {
namespace {

const std::string kScanFolder = TAVI_SOURCE_DIR "/Tavi/public/cascades/x16Net-demo";

TEST(ShippedScanNetTest, StoresAZeroResponseAndScansSmallerLevelsLikeANetOfTheirSize) {
  CascadeStage primed = loadFullStage(kScanFolder);
  nn::Net<float>& net = *primed.net;
  // Declared large enough for a 1920 by 1080 photo searched for 40 pixels.
  ASSERT_GE(net.net_input_blobs()[0]->width(), 576);
  ASSERT_GE(net.net_input_blobs()[0]->height(), 576);

  // A constant image of 100 gives the first convolution r + r: the stored
  // response r, added once more by the primed pass.
  net.AlterInputShape(40, 30);
  nn::Blob<float>& input = *net.net_input_blobs()[0];
  std::fill_n(input.mutable_cpu_data(), input.count(), 100.0f);
  net.FF();
  const nn::Blob<float>& firstConvolution = *net.top_vecs()[0][0];
  for (int i = 0; i < firstConvolution.count(); ++i) {
    ASSERT_NEAR(firstConvolution.cpu_data()[i], 0.0f, 1e-4f) << i;
  }

  // A pyramid level smaller than the declared input, through the primed net,
  // against a plain pass of the net declared at the level's size.
  const int width = 97;
  const int height = 71;
  nn::NetParameter description;
  nn::ReadNetParamsFromTextFile(kScanFolder + "/prototxt-full", &description);
  description.set_input_dim(2, height);
  description.set_input_dim(3, width);
  nn::Net<float> plain(description);
  plain.CopyTrainedLayersFrom(kScanFolder + "/proto-full");
  cv::Mat level(height, width, CV_8UC3);
  cv::randu(level, cv::Scalar::all(0), cv::Scalar::all(256));
  net.AlterInputShape(width, height);
  writeImagePlanes(level, &input);
  writeImagePlanes(level, plain.net_input_blobs()[0]);
  const nn::Blob<float>& scanned = *net.FF()[0];
  const nn::Blob<float>& expected = *plain.Forward()[0];
  ASSERT_EQ(scanned.count(), expected.count());
  for (int i = 0; i < expected.count(); ++i) {
    ASSERT_NEAR(scanned.cpu_data()[i], expected.cpu_data()[i], 1e-5f) << i;
  }
}

}  // namespace
}  // namespace tavilib
