#ifndef TESTS_TAVI_SRC_DETECTOR_TEST_CASCADE_H_
#define TESTS_TAVI_SRC_DETECTOR_TEST_CASCADE_H_

// Small cascade model folders whose nets behave predictably, for tests.

#include <opencv2/core.hpp>

#include <filesystem>
#include <string>
#include <vector>

#include "blob_proto_maker.h"
#include "nn/proto/nn.pb.h"
#include "tavilib.h"
#include "temp_dir.h"

namespace tavilib {
namespace testing_cascade {

using nn::MakeBlob;

const std::string kCalibrationFolder = "cascades/x32Net-x32-3Scales-200";
const std::string kShippedOffsets =
    TAVI_SOURCE_DIR "/Tavi/public/cascades/x32Net-x32-3Scales-200/offsets-scales";

// A window net of a 24 x 24 input whose outputs are fixed by the biases of
// one fully connected layer: classes logits, the input ignored.
inline std::string ConstantWindowText(int classes) {
  return "name: 'constant' input: 'data' input_dim: 1 input_dim: 3 input_dim: 24 input_dim: 24"
         " layers { name: 'fc' type: INNER_PRODUCT bottom: 'data' top: 'fc'"
         "   inner_product_param { num_output: " + std::to_string(classes) + " } }"
         " layers { name: 'probs' type: SOFTMAX bottom: 'fc' top: 'probs' }";
}

inline std::string ConstantWindowWeights(const std::vector<float>& logits) {
  nn::NetParameter weights;
  nn::LayerParameter* fc = weights.add_layers();
  fc->set_name("fc");
  const int classes = static_cast<int>(logits.size());
  *fc->add_blobs() = MakeBlob(1, 1, classes, 1728, std::vector<float>(classes * 1728, 0.0f));
  *fc->add_blobs() = MakeBlob(1, 1, 1, classes, logits);
  return weights.SerializeAsString();
}

// Logits that make class `favoured` of 19 almost certain.
inline std::vector<float> Favour(int favoured) {
  std::vector<float> logits(19, 0.0f);
  logits[favoured] = 10.0f;
  return logits;
}

// A model folder: a scan stage finds bright patches, each later stage grades
// every window with a fixed face probability, and the calibration net always
// picks one class of the shipped table.
class TestModelFolder {
 public:
  explicit TestModelFolder(const TempDir& dir) : dir_(dir), root_(dir.path() + "/") {}

  // One 12 x 12 convolution of stride 6 into two classes over a declared
  // input of 200 x 200. The face logit is 0.1 * (mean brightness + 100) -
  // 22.8 once the stored response (the bias again) is added: a window is a
  // face when its mean is above 128.
  void addScanStage(const std::string& name) {
    dir_.write(name + "/prototxt-full",
               "name: 'bright' input: 'data' input_dim: 1 input_dim: 3 input_dim: 200 input_dim: 200"
                   " layers { name: 'conv' type: CONVOLUTION bottom: 'data' top: 'conv'"
                   "   convolution_param { num_output: 2 kernel_size: 12 stride: 6 } }"
                   " layers { name: 'probs' type: SOFTMAX bottom: 'conv' top: 'probs' }");
    nn::NetParameter weights;
    nn::LayerParameter* conv = weights.add_layers();
    conv->set_name("conv");
    std::vector<float> kernel(2 * 3 * 12 * 12, 0.0f);
    std::fill(kernel.begin() + 432, kernel.end(), 0.1f / 432.0f);
    *conv->add_blobs() = MakeBlob(2, 3, 12, 12, kernel);
    *conv->add_blobs() = MakeBlob(1, 1, 1, 2, {0.0f, -11.4f});
    dir_.write(name + "/proto-full", weights.SerializeAsString());
  }

  void addConstantStage(const std::string& name, const std::vector<float>& logits) {
    dir_.write(name + "/prototxt-deploy", ConstantWindowText(static_cast<int>(logits.size())));
    dir_.write(name + "/proto", ConstantWindowWeights(logits));
    std::string mean;
    for (int i = 0; i < 1728; ++i) mean += "128 ";
    dir_.write(name + "/mean", mean);
  }

  void addCalibration(int favouredClass) {
    addConstantStage(kCalibrationFolder, Favour(favouredClass));
    std::filesystem::copy_file(kShippedOffsets, dir_.path() + "/" + kCalibrationFolder + "/offsets-scales",
                               std::filesystem::copy_options::overwrite_existing);
  }

  void writeList(const std::string& contents) { dir_.write("cascade.list", contents); }

  DetectorParams params() const { return DetectorParams(root_.c_str(), "cascade.list"); }

 private:
  const TempDir& dir_;
  const std::string root_;
};

// A black BGR image with a white rectangle.
inline cv::Mat ImageWithPatch(int width, int height, const cv::Rect& patch) {
  cv::Mat image(height, width, CV_8UC3, cv::Scalar::all(0));
  image(patch).setTo(cv::Scalar::all(255));
  return image;
}

inline Image AsImage(cv::Mat& image) {
  return Image{image.cols, image.rows, static_cast<int32_t>(image.step), image.data};
}

}  // namespace testing_cascade
}  // namespace tavilib

#endif  // TESTS_TAVI_SRC_DETECTOR_TEST_CASCADE_H_
