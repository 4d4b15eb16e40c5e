#include "landmark_training/training_boxes.h"

#include <cblas.h>

#include <cmath>
#include <stdexcept>

#include "detector/cascade_loader.h"
#include "detector/detector_state.h"
#include "detector_training/counted_detection.h"
#include "detector_training/face_box.h"
#include "detector_training/parallel_items.h"
#include "detector/scan_settings.h"
#include "nn/net.h"

namespace landmarks {

namespace {

constexpr float kMatchIoU = 0.5f;
constexpr int kMinFace = 20;
constexpr size_t kWorkers = 2;

cv::Rect2f toRect(const tavilib::Rectangle<float>& box) {
  return cv::Rect2f(box.left, box.top, box.right - box.left, box.bottom - box.top);
}

}  // namespace

std::vector<tavilib::Rectangle<float>> detectorBoxes(const std::string& cascadeRoot,
                                                     const std::vector<cv::Mat>& images,
                                                     const std::vector<cv::Rect2f>& faces) {
  openblas_set_num_threads(1);
  std::vector<tavilib::DetectorState> states(kWorkers);
  const tavilib::DetectorParams where(cascadeRoot.c_str(), "cascade.list");
  for (tavilib::DetectorState& state : states) {
    if (tavilib::loadCascadeFromFolder(state, where) != tavilib::STATUS_OK) {
      throw std::runtime_error("cannot load the cascade " + cascadeRoot + "cascade.list");
    }
    state.ready = true;
  }
  const nn::Net<float>& scan = *states[0].stages[0].net;
  std::vector<tavilib::Rectangle<float>> found(images.size(), tavilib::Rectangle<float>{0, 0, 0, 0});
  training::forEachItem(images.size(), kWorkers, [&](size_t i, size_t worker) {
    training::StageCounts counts;
    const cv::Mat& image = images[i];
    float best = -1.0f;
    for (const tavilib::Detection& detection : training::detectCounting(
             states[worker], image,
             tavilib::fittingScanSettings(image.cols, image.rows, kMinFace,
                                          scan.declared_input_width(),
                                          scan.declared_input_height()),
             counts)) {
      if (detection.score > best &&
          training::intersectionOverUnion(toRect(detection.box), faces[i]) >= kMatchIoU) {
        best = detection.score;
        found[i] = detection.box;
      }
    }
  });
  return found;
}

BoxError measureBoxError(const std::vector<tavilib::Rectangle<float>>& found,
                         const std::vector<cv::Rect2f>& faces) {
  double n = 0.0;
  double sum[3] = {0.0, 0.0, 0.0};
  double squares[3] = {0.0, 0.0, 0.0};
  for (size_t i = 0; i < found.size(); ++i) {
    const cv::Rect2f box = toRect(found[i]);
    if (box.width <= 0.0f) {
      continue;
    }
    const cv::Rect2f& face = faces[i];
    const double values[3] = {
        (box.x + 0.5 * box.width - face.x - 0.5 * face.width) / face.width,
        (box.y + 0.5 * box.height - face.y - 0.5 * face.height) / face.width,
        std::log(box.width / face.width)};
    for (int v = 0; v < 3; ++v) {
      sum[v] += values[v];
      squares[v] += values[v] * values[v];
    }
    n += 1.0;
  }
  BoxError error;
  if (n == 0.0) {
    return error;
  }
  auto spread = [&](int v) {
    return static_cast<float>(std::sqrt(std::max(0.0, squares[v] / n - sum[v] * sum[v] / n / n)));
  };
  error.meanShift = cv::Point2f(static_cast<float>(sum[0] / n), static_cast<float>(sum[1] / n));
  error.meanLogScale = static_cast<float>(sum[2] / n);
  error.shiftSpread = cv::Point2f(spread(0), spread(1));
  error.logScaleSpread = spread(2);
  return error;
}

tavilib::Rectangle<float> jitteredBox(const cv::Rect2f& face, const BoxError& error,
                                      std::mt19937& random) {
  std::normal_distribution<float> draw(0.0f, 1.0f);
  const float side = face.width * std::exp(error.meanLogScale + error.logScaleSpread * draw(random));
  const float centreX =
      face.x + 0.5f * face.width + face.width * (error.meanShift.x + error.shiftSpread.x * draw(random));
  const float centreY =
      face.y + 0.5f * face.height + face.width * (error.meanShift.y + error.shiftSpread.y * draw(random));
  return tavilib::Rectangle<float>{centreX - 0.5f * side, centreY - 0.5f * side,
                                   centreX + 0.5f * side, centreY + 0.5f * side};
}

}  // namespace landmarks
