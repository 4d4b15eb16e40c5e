#include "detector_training/window_set.h"

#include <algorithm>
#include <numeric>

#include "detector/image_planes.h"

namespace training {

size_t WindowSet::count(int label) const {
  return static_cast<size_t>(std::count(labels.begin(), labels.end(), label));
}

WindowSet subsample(const WindowSet& set, size_t limit, std::mt19937& random) {
  if (set.size() <= limit) {
    return set;
  }
  std::vector<size_t> order(set.size());
  std::iota(order.begin(), order.end(), 0);
  std::shuffle(order.begin(), order.end(), random);
  order.resize(limit);
  std::sort(order.begin(), order.end());
  WindowSet kept;
  for (size_t i : order) {
    kept.add(set.windows[i], set.labels[i]);
  }
  return kept;
}

std::vector<float> planeMean(const WindowSet& set) {
  const int count = static_cast<int>(set.windows[0].total()) * 3;
  std::vector<double> sum(count, 0.0);
  std::vector<float> planes(count);
  for (const cv::Mat& window : set.windows) {
    tavilib::writeImagePlanes(window, planes.data(), count);
    for (int i = 0; i < count; ++i) {
      sum[i] += planes[i];
    }
  }
  std::vector<float> mean(count);
  for (int i = 0; i < count; ++i) {
    mean[i] = static_cast<float>(sum[i] / static_cast<double>(set.size()));
  }
  return mean;
}

}  // namespace training
