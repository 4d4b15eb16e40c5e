#include "detector_training/stage_windows.h"

#include <opencv2/imgproc.hpp>

#include <algorithm>

#include "detector_training/cascade_recorder.h"
#include "detector_training/face_box.h"
#include "detector_training/parallel_items.h"
#include "detector/scan_settings.h"

namespace training {

namespace {

// Random negatives are at least this large in the image, the smallest face
// the detector is asked for.
constexpr int kSmallestFace = 20;
// The square root of the scan's scale step.
constexpr double kHalfScaleStep = 0.9128709;

cv::Rect2f toRect(const tavilib::Window& window) {
  return cv::Rect2f(static_cast<float>(window.x), static_cast<float>(window.y),
                    static_cast<float>(window.width), static_cast<float>(window.height));
}

void addIfCut(WindowSet& set, cv::Mat window, int label) {
  if (!window.empty()) {
    set.add(std::move(window), label);
  }
}

// Up to limit of the windows, picked at random.
std::vector<tavilib::Window> pick(std::vector<tavilib::Window> windows, int limit,
                                  std::mt19937& random) {
  std::shuffle(windows.begin(), windows.end(), random);
  windows.resize(std::min(windows.size(), static_cast<size_t>(limit)));
  return windows;
}

// The cascade's windows, cut as the next stage would see them, with no
// change of appearance.
void addMined(WindowSet& set, const cv::Mat& image, const std::vector<tavilib::Window>& windows,
              int label, WindowSampler& sampler) {
  for (const tavilib::Window& window : windows) {
    addIfCut(set, sampler.cut(image, toRect(window), false), label);
  }
}

}  // namespace

WindowSet drawPositives(const DetectorData& data, const StageRecipe& recipe,
                        WindowSampler& sampler) {
  WindowSet set;
  for (int k = 0; k < recipe.positivesPerFace; ++k) {
    for (const FaceImage& face : data.faces) {
      addIfCut(set, sampler.positive(face.pixels, face.box, recipe.jitter), 1);
    }
    for (const cv::Mat& crop : data.crops) {
      const cv::Rect2f box(0.0f, 0.0f, static_cast<float>(crop.cols), static_cast<float>(crop.rows));
      addIfCut(set, sampler.positive(crop, box, recipe.jitter), 1);
    }
  }
  return set;
}

WindowSet drawCalibrationWindows(const DetectorData& data, int perFace,
                                 const std::vector<tavilib::OffsetScale>& table,
                                 WindowSampler& sampler) {
  WindowSet set;
  std::uniform_int_distribution<int> anyClass(0, static_cast<int>(table.size()) - 1);
  const int netSide = sampler.side();
  for (int k = 0; k < perFace; ++k) {
    for (const FaceImage& face : data.faces) {
      const int label = anyClass(sampler.random());
      addIfCut(set, sampler.calibrationWindow(face.pixels, face.box, table[label], netSide), label);
    }
    for (const cv::Mat& crop : data.crops) {
      const cv::Rect2f box(0.0f, 0.0f, static_cast<float>(crop.cols), static_cast<float>(crop.rows));
      const int label = anyClass(sampler.random());
      addIfCut(set, sampler.calibrationWindow(crop, box, table[label], netSide), label);
    }
  }
  return set;
}

namespace {

WindowSet negativeImageWindows(const cv::Mat& image, const StageRecipe& recipe,
                               tavilib::DetectorState& cascade, bool mining,
                               const FixedWindowScan& scan, WindowSampler& sampler) {
  WindowSet set;
  for (int k = 0; k < recipe.randomNegativesPerImage; ++k) {
    addIfCut(set, sampler.negative(image, kSmallestFace), 0);
  }
  if (!mining) {
    return set;
  }
  // The mirrored image and one scaled by half a pyramid step meet the scan's
  // grid at other places, and give other hard windows.
  for (int variant = 0; variant < recipe.miningVariants; ++variant) {
    cv::Mat seen = image;
    if (variant % 2 == 1) {
      cv::flip(image, seen, 1);
    }
    if (variant >= 2) {
      cv::resize(seen, seen, cv::Size(), kHalfScaleStep, kHalfScaleStep, cv::INTER_AREA);
    }
    const auto settings = tavilib::fittingScanSettings(seen.cols, seen.rows, scan.minFace, scan.maxBase, scan.maxBase);
    addMined(set, seen,
             pick(windowsForNextStage(cascade, seen, settings), recipe.minedPerNegativeImage,
                  sampler.random()),
             0, sampler);
  }
  return set;
}

WindowSet faceImageWindows(const FaceImage& face, const StageRecipe& recipe,
                           tavilib::DetectorState& cascade, bool mining,
                           const FixedWindowScan& scan, WindowSampler& sampler) {
  WindowSet set;
  for (int k = 0; k < recipe.partFacesPerImage; ++k) {
    addIfCut(set, sampler.partFace(face.pixels, face.box), 0);
  }
  if (!mining) {
    return set;
  }
  std::vector<tavilib::Window> positives;
  std::vector<tavilib::Window> negatives;
  const auto settings =
      tavilib::fittingScanSettings(face.pixels.cols, face.pixels.rows, scan.minFaceInFaceImages,
                                   scan.maxBase, scan.maxBase);
  for (const tavilib::Window& window : windowsForNextStage(cascade, face.pixels, settings)) {
    const cv::Rect2f rect = toRect(window);
    const float overlap = intersectionOverUnion(rect, face.box);
    if (overlap >= recipe.minPositiveIoU) {
      positives.push_back(window);
    } else if (overlap < recipe.maxNegativeIoU && (rect & face.box).area() > 0.0f) {
      negatives.push_back(window);
    }
  }
  addMined(set, face.pixels, pick(positives, recipe.minedPerFaceImage, sampler.random()), 1,
           sampler);
  addMined(set, face.pixels, pick(negatives, recipe.minedPerFaceImage, sampler.random()), 0,
           sampler);
  return set;
}

}  // namespace

WindowSet drawFixedWindows(const DetectorData& data, const StageRecipe& recipe,
                           std::vector<tavilib::DetectorState>& cascades,
                           const FixedWindowScan& scan, unsigned seed) {
  const bool mining = !cascades[0].stages.empty() &&
                      (recipe.minedPerNegativeImage > 0 || recipe.minedPerFaceImage > 0);
  const size_t images = data.negatives.size() + data.faces.size();
  std::vector<WindowSet> perImage(images);
  // Each image has a generator of its own, so that the windows do not depend
  // on which worker took the image.
  forEachItem(images, cascades.size(), [&](size_t i, size_t worker) {
    WindowSampler sampler(recipe.side, seed * 1000003u + static_cast<unsigned>(i));
    perImage[i] = i < data.negatives.size()
                      ? negativeImageWindows(data.negatives[i], recipe, cascades[worker], mining,
                                             scan, sampler)
                      : faceImageWindows(data.faces[i - data.negatives.size()], recipe,
                                         cascades[worker], mining, scan, sampler);
  });
  WindowSet set;
  for (const WindowSet& part : perImage) {
    set.append(part);
  }
  return set;
}

}  // namespace training
