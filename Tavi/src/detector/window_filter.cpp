#include "detector/window_filter.h"

#include <algorithm>
#include <cstdint>
#include <map>
#include <utility>

namespace tavilib {

namespace {

// Windows scoring below this never enter a suppression pass.
constexpr float kMergeScoreLimit = 0.0f;
constexpr float kPerSizeOverlapLimit = 0.5f;
constexpr float kFinalOverlapLimit = 0.25f;

int32_t right(const Window& w) { return w.x + w.width; }
int32_t bottom(const Window& w) { return w.y + w.height; }
int32_t area(const Window& w) { return w.width * w.height; }

float intersection(const Window& a, const Window& b) {
  const int32_t width = std::min(right(a), right(b)) - std::max(a.x, b.x);
  const int32_t height = std::min(bottom(a), bottom(b)) - std::max(a.y, b.y);
  if (width < 1 || height < 1) {
    return 0.0f;
  }
  return static_cast<float>(width * height);
}

float intersectionOverUnion(const Window& candidate, const Window& kept, float overlap) {
  return overlap / (static_cast<float>(area(candidate) + area(kept)) - overlap);
}

float intersectionOverSmaller(const Window& candidate, const Window& kept, float overlap) {
  return std::max(overlap / static_cast<float>(area(candidate)),
                  overlap / static_cast<float>(area(kept)));
}

using OverlapMeasure = float (*)(const Window&, const Window&, float);

std::vector<Window> suppress(const std::vector<Window>& windows, OverlapMeasure measure,
                             float overlapLimit) {
  std::vector<std::pair<int32_t, float>> order;
  order.reserve(windows.size());
  for (size_t i = 0; i < windows.size(); ++i) {
    order.emplace_back(static_cast<int32_t>(i), -windows[i].score);
  }
  std::sort(order.begin(), order.end(),
            [](const std::pair<int32_t, float>& a, const std::pair<int32_t, float>& b) {
              return a.second < b.second;
            });

  std::vector<Window> kept;
  for (const auto& entry : order) {
    const Window& candidate = windows[entry.first];
    if (candidate.score < kMergeScoreLimit) {
      break;
    }
    bool overlapping = false;
    for (const Window& other : kept) {
      const float overlap = intersection(candidate, other);
      if (overlap > 0.0f && measure(candidate, other, overlap) > overlapLimit) {
        overlapping = true;
      }
    }
    if (!overlapping) {
      kept.push_back(candidate);
    }
  }
  return kept;
}

}  // namespace

void sortByScore(std::vector<Window>& windows) {
  std::sort(windows.begin(), windows.end(),
            [](const Window& a, const Window& b) { return a.score > b.score; });
}

std::vector<Window> keepAboveThreshold(const std::vector<Window>& windows, float threshold) {
  std::vector<Window> kept;
  for (const Window& window : windows) {
    if (window.score > threshold) {
      kept.push_back(window);
    }
  }
  return kept;
}

std::vector<Window> mergePerSize(const std::vector<Window>& windows) {
  std::map<int32_t, size_t> groupOfWidth;
  std::vector<std::vector<Window>> groups;
  for (const Window& window : windows) {
    auto found = groupOfWidth.find(window.width);
    if (found == groupOfWidth.end()) {
      found = groupOfWidth.emplace(window.width, groups.size()).first;
      groups.emplace_back();
    }
    groups[found->second].push_back(window);
  }
  std::vector<Window> merged;
  for (const std::vector<Window>& group : groups) {
    const std::vector<Window> kept = suppress(group, intersectionOverUnion, kPerSizeOverlapLimit);
    merged.insert(merged.end(), kept.begin(), kept.end());
  }
  return merged;
}

std::vector<Window> mergeFinal(const std::vector<Window>& windows) {
  return suppress(windows, intersectionOverSmaller, kFinalOverlapLimit);
}

}  // namespace tavilib
