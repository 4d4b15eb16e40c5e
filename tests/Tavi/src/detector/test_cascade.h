#ifndef TESTS_TAVI_SRC_DETECTOR_TEST_CASCADE_H_
#define TESTS_TAVI_SRC_DETECTOR_TEST_CASCADE_H_

// Small cascade model folders whose nets behave predictably, for tests.

#include <opencv2/core.hpp>

#include <string>
#include <vector>

#include "blob_proto_maker.h"
#include "nn/net.h"
#include "nn/proto/nn.pb.h"
#include "temp_dir.h"
#include "tavilib.h"

namespace tavilib {
namespace testing_cascade {

using nn::MakeBlob;

// A scan net over a declared input of size x size: one 12 x 12 convolution of
// stride 6 into two classes, then the softmax. The face logit is
// 0.1 * (mean brightness + 100) - 22.8 once FirstRun's response (which holds
// the bias again) is added, so a window is a face when its mean is above 128.
inline std::string BrightPatchScanText(int size) {
  return "name: 'bright' input: 'data' input_dim: 1 input_dim: 3 input_dim: " +
         std::to_string(size) + " input_dim: " + std::to_string(size) +
         " layers { name: 'conv' type: CONVOLUTION bottom: 'data' top: 'conv'"
         "   convolution_param { num_output: 2 kernel_size: 12 stride: 6 } }"
         " layers { name: 'probs' type: SOFTMAX bottom: 'conv' top: 'probs' }";
}

inline nn::NetParameter BrightPatchScanWeights() {
  nn::NetParameter weights;
  nn::LayerParameter* conv = weights.add_layers();
  conv->set_name("conv");
  std::vector<float> kernel(2 * 3 * 12 * 12, 0.0f);
  std::fill(kernel.begin() + 432, kernel.end(), 0.1f / 432.0f);
  *conv->add_blobs() = MakeBlob(2, 3, 12, 12, kernel);
  *conv->add_blobs() = MakeBlob(1, 1, 1, 2, {0.0f, -11.4f});
  return weights;
}

// A window net of a 24 x 24 input whose outputs are fixed by the biases of
// one fully connected layer: classes logits, the input ignored.
inline std::string ConstantWindowText(int classes) {
  return "name: 'constant' input: 'data' input_dim: 1 input_dim: 3 input_dim: 24 input_dim: 24"
         " layers { name: 'fc' type: INNER_PRODUCT bottom: 'data' top: 'fc'"
         "   inner_product_param { num_output: " +
         std::to_string(classes) +
         " } }"
         " layers { name: 'probs' type: SOFTMAX bottom: 'fc' top: 'probs' }";
}

inline nn::NetParameter ConstantWindowWeights(const std::vector<float>& logits) {
  nn::NetParameter weights;
  nn::LayerParameter* fc = weights.add_layers();
  fc->set_name("fc");
  const int classes = static_cast<int>(logits.size());
  *fc->add_blobs() = MakeBlob(1, 1, classes, 1728, std::vector<float>(classes * 1728, 0.0f));
  *fc->add_blobs() = MakeBlob(1, 1, 1, classes, logits);
  return weights;
}

// Logits that make class `favoured` of `classes` almost certain.
inline std::vector<float> FavourClass(int classes, int favoured) {
  std::vector<float> logits(classes, 0.0f);
  logits[favoured] = 10.0f;
  return logits;
}

// Writes the weights of every layer of a net, as a trained weight file.
inline std::string WeightsOf(nn::Net<float>& net) {
  nn::NetParameter weights;
  for (const auto& layer : net.layers()) {
    layer->ToProto(weights.add_layers());
  }
  return weights.SerializeAsString();
}

// A mean file of count values 128, ending in a newline.
inline std::string FlatMean(int count) {
  std::string values;
  for (int i = 0; i < count; ++i) {
    values += "128 ";
  }
  return values + "\n";
}

// The calibration table of the built-in cascade in the offsets file's form.
inline std::string DefaultOffsetsScales() {
  return "0 0 1\n-4 -4 1\n-4 0 1\n0 -4 1\n4 0 1\n4 -4 1\n-4 4 1\n0 4 1\n4 4 1\n"
         "1 1 0.9166666666666666\n-1 -1 1.0833333333333333\n-3 -3 0.9166666666666666\n"
         "-3 1 0.9166666666666666\n1 -3 0.9166666666666666\n5 1 0.9166666666666666\n"
         "5 -3 0.9166666666666666\n-3 5 0.9166666666666666\n1 5 0.9166666666666666\n"
         "5 5 0.9166666666666666\n";
}

// A model folder: the first stage scans for bright patches, each later stage
// grades every window with a fixed face probability, and the calibration net
// always picks one class of the built-in table.
class TestModelFolder {
 public:
  explicit TestModelFolder(const TempDir& dir) : dir_(dir) {}

  void addScanStage(const std::string& name, int size) {
    dir_.write(name + "/prototxt-full", BrightPatchScanText(size));
    dir_.write(name + "/proto-full", BrightPatchScanWeights().SerializeAsString());
  }

  void addConstantStage(const std::string& name, float faceLogit) {
    dir_.write(name + "/prototxt-deploy", ConstantWindowText(2));
    dir_.write(name + "/proto", ConstantWindowWeights({0.0f, faceLogit}).SerializeAsString());
    dir_.write(name + "/mean", FlatMean(1728));
  }

  void addCalibration(int favouredClass) {
    const std::string folder = "cascades/x32Net-x32-3Scales-200";
    dir_.write(folder + "/prototxt-deploy", ConstantWindowText(19));
    dir_.write(folder + "/proto",
               ConstantWindowWeights(FavourClass(19, favouredClass)).SerializeAsString());
    dir_.write(folder + "/mean", FlatMean(1728));
    dir_.write(folder + "/offsets-scales", DefaultOffsetsScales());
  }

  void writeList(const std::string& contents) { dir_.write("cascade.list", contents); }

  DetectorParams params() {
    root_ = dir_.path() + "/";
    return DetectorParams(root_.c_str(), list_);
  }

 private:
  const TempDir& dir_;
  std::string root_;
  const char* list_ = "cascade.list";
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
