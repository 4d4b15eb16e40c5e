#ifndef TOOLS_DETECTOR_TRAINING_WINDOW_SET_H_
#define TOOLS_DETECTOR_TRAINING_WINDOW_SET_H_

#include <opencv2/core.hpp>

#include <random>
#include <vector>

namespace training {

// Training windows of one net's input size: 8-bit 3-channel crops, cut and
// resized by the library's own window preparation, each with a class.
struct WindowSet {
  std::vector<cv::Mat> windows;
  std::vector<int> labels;

  void add(cv::Mat window, int label) {
    windows.push_back(std::move(window));
    labels.push_back(label);
  }
  void append(const WindowSet& other) {
    windows.insert(windows.end(), other.windows.begin(), other.windows.end());
    labels.insert(labels.end(), other.labels.begin(), other.labels.end());
  }
  size_t size() const { return windows.size(); }
  size_t count(int label) const;
};

// Keeps at most limit windows of the set, chosen at random, order kept.
WindowSet subsample(const WindowSet& set, size_t limit, std::mt19937& random);

// The per-element mean of the windows as the nets see them: three planes,
// first the third byte of each pixel, then the second, then the first.
// REQUIRES: a non-empty set of equally sized windows.
std::vector<float> planeMean(const WindowSet& set);

}  // namespace training

#endif  // TOOLS_DETECTOR_TRAINING_WINDOW_SET_H_
