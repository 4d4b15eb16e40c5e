#ifndef TAVI_SRC_DETECTOR_WINDOW_FILTER_H_
#define TAVI_SRC_DETECTOR_WINDOW_FILTER_H_

#include <vector>

#include "detector/window.h"

namespace tavilib {

// Highest score first. Unstable: windows of equal score keep no promised order.
void sortByScore(std::vector<Window>& windows);

// Keeps, in order, the windows scoring strictly above threshold.
std::vector<Window> keepAboveThreshold(const std::vector<Window>& windows, float threshold);

// Suppression within each group of windows of one width, by intersection over
// union above 0.5. Groups come in order of their widths' first appearance, each
// best first, so the result is not ordered by score overall.
std::vector<Window> mergePerSize(const std::vector<Window>& windows);

// Suppression over the whole list by intersection over the smaller area above
// 0.25. The result is in order of falling score.
std::vector<Window> mergeFinal(const std::vector<Window>& windows);

}  // namespace tavilib

#endif  // TAVI_SRC_DETECTOR_WINDOW_FILTER_H_
