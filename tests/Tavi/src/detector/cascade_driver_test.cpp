#include "detector/cascade_driver.h"

#include <gtest/gtest.h>

#include <map>
#include <string>
#include <utility>
#include <vector>

namespace tavilib {
namespace {

Window makeWindow(int x, int y, int side, float score) { return Window{x, y, side, side, score, 0}; }

// Stands in for the networks: the scan yields fixed windows, and each grading
// stage scores a window by its x coordinate. Every call is logged with the
// windows it received.
class FakeCascade {
 public:
  explicit FakeCascade(const std::vector<float>& thresholds) {
    for (float threshold : thresholds) {
      state.stages.emplace_back();
      state.stages.back().threshold = threshold;
    }
    state.ready = true;
  }

  // Runs the cascade on a black image of width x height with the given row
  // stride.
  Status run(std::vector<Detection>& detections, int width, int height, int stride = 0) {
    std::vector<unsigned char> pixels(static_cast<size_t>(stride ? stride : width * 3) * height);
    CascadeSteps steps;
    steps.scan = [this, width, height](const cv::Mat& image, const CascadeParameter&, CascadeStage& first) {
      EXPECT_EQ(&first, &state.stages[0]);
      EXPECT_EQ(image.size(), cv::Size(width, height));
      log("scan", {});
      return PyramidScan{scanWindows, baseScale};
    };
    steps.grade = [this](std::vector<Window> windows, CascadeStage& stage, const cv::Mat&) {
      const size_t s = static_cast<size_t>(&stage - state.stages.data());
      log("grade" + std::to_string(s), windows);
      for (Window& w : windows) w.score = scoreAtStage[s][w.x];
      return windows;
    };
    steps.calibrate = [this](std::vector<Window> windows, CascadeStage& calibration, const cv::Mat&) {
      EXPECT_EQ(&calibration, &state.calibration);
      log("calibrate", windows);
      for (Window& w : windows) {
        if (calibratedX.count(w.x)) w.x = calibratedX[w.x];
      }
      return windows;
    };
    const CascadeParameter params{1.0f, 320, 0.05f, 3, 1.5f, 12};
    return runCascade(Image{width, height, stride, pixels.data()}, state, detections, params, steps);
  }

  void log(const std::string& call, const std::vector<Window>& windows) {
    calls.push_back(call);
    received.push_back(windows);
  }

  DetectorState state;
  std::vector<Window> scanWindows;
  float baseScale = 1.0f;
  std::map<size_t, std::map<int, float>> scoreAtStage;
  std::map<int, int> calibratedX;
  std::vector<std::string> calls;
  std::vector<std::vector<Window>> received;
};

TEST(CascadeDriverTest, OneStageScalesBackSortsThresholdsAndMergesFinally) {
  FakeCascade cascade({0.4f});
  std::vector<Detection> detections(1);
  detections[0].score = -1.0f;
  cascade.state.ready = false;
  EXPECT_EQ(cascade.run(detections, 40, 30), STATUS_DETECTOR_NOT_READY);
  EXPECT_TRUE(cascade.calls.empty());
  cascade.state.ready = true;

  // The worked pyramid example: a base scale of 0.15 brings the last windows of
  // levels 0 and 1 to (1513, 1113, 80) and (1466, 1066, 120).
  cascade.baseScale = 0.15f;
  cascade.scanWindows = {makeWindow(227, 167, 12, 0.5f), makeWindow(0, 0, 12, 0.4f),
                         makeWindow(30, 0, 12, 0.9f), makeWindow(31, 0, 12, 0.8f)};
  ASSERT_EQ(cascade.run(detections, 1600, 1200, 1600 * 3 + 7), STATUS_OK);
  EXPECT_EQ(cascade.calls, (std::vector<std::string>{"scan"}));
  // A second call appends its own list behind the first.
  cascade.scanWindows = {makeWindow(220, 160, 18, 0.45f)};
  ASSERT_EQ(cascade.run(detections, 1600, 1200), STATUS_OK);

  // Behind the old entry; 0.4 is not above the threshold; (31, 0) overlaps
  // (30, 0); each list is best first.
  ASSERT_EQ(detections.size(), 4u);
  EXPECT_EQ(detections[0].score, -1.0f);
  const float expected[3][5] = {{0.9f, 200, 0, 280, 80},  // 30 / 0.15 truncated
                                {0.5f, 1513, 1113, 1593, 1193},
                                {0.45f, 1466, 1066, 1586, 1186}};
  for (size_t i = 0; i < 3; ++i) {
    const Rectangle<float>& box = detections[i + 1].box;
    EXPECT_EQ((std::vector<float>{detections[i + 1].score, box.left, box.top, box.right, box.bottom}),
              std::vector<float>(expected[i], expected[i] + 5)) << i;
  }
}

TEST(CascadeDriverTest, LaterStagesGradeWhatPassedTheStageBeforeInScoreOrder) {
  FakeCascade cascade({0.5f, 0.7f});
  cascade.scanWindows = {makeWindow(100, 0, 10, 0.55f), makeWindow(200, 0, 10, 0.5f),
                         makeWindow(0, 0, 10, 0.6f)};
  cascade.scoreAtStage[1] = {{0, 0.7f}, {100, 0.95f}};
  std::vector<Detection> detections;
  ASSERT_EQ(cascade.run(detections, 400, 100), STATUS_OK);
  const std::vector<Window>& graded = cascade.received[1];
  ASSERT_EQ(graded.size(), 2u);
  EXPECT_EQ(graded[0].x, 0);
  EXPECT_EQ(graded[1].x, 100);
  ASSERT_EQ(detections.size(), 1u);
  EXPECT_EQ(detections[0].box.left, 100.0f);
  EXPECT_EQ(detections[0].score, 0.95f);

  // Only the stages between the first and the last calibrate.
  const std::vector<std::string> calls[] = {
      {"scan", "grade1"}, {"scan", "grade1", "calibrate", "grade2"},
      {"scan", "grade1", "calibrate", "grade2", "calibrate", "grade3"}};
  for (size_t stages = 2; stages <= 4; ++stages) {
    FakeCascade chain(std::vector<float>(stages, 0.0f));
    chain.scanWindows = {makeWindow(0, 0, 10, 0.5f)};
    for (size_t s = 1; s < stages; ++s) chain.scoreAtStage[s] = {{0, 0.5f}};
    detections.clear();
    ASSERT_EQ(chain.run(detections, 50, 50), STATUS_OK);
    EXPECT_EQ(chain.calls, calls[stages - 2]);
    EXPECT_EQ(detections.size(), 1u);
  }
}

TEST(CascadeDriverTest, MiddleStageCalibratesAndMergesBeforeItsThreshold) {
  FakeCascade cascade({0.1f, 0.8f, 0.5f});
  cascade.scanWindows = {makeWindow(0, 0, 20, 0.9f), makeWindow(50, 0, 20, 0.8f),
                         makeWindow(100, 0, 20, 0.7f)};
  cascade.scoreAtStage[1] = {{0, 0.85f}, {50, 0.9f}, {100, 0.3f}};
  // Calibration moves the window at 50 onto the one at 0, where it suppresses
  // it in the per-size merge.
  cascade.calibratedX = {{50, 1}};
  cascade.scoreAtStage[2] = {{1, 0.6f}};
  std::vector<Detection> detections;
  ASSERT_EQ(cascade.run(detections, 200, 100), STATUS_OK);
  EXPECT_EQ(cascade.received[2].size(), 3u) << "calibration sees windows below the threshold";
  const std::vector<Window>& lastGraded = cascade.received[3];
  ASSERT_EQ(lastGraded.size(), 1u) << "merged, then cut at 0.8";
  EXPECT_EQ(lastGraded[0].x, 1);
  EXPECT_EQ(lastGraded[0].score, 0.9f) << "scores from the grading stage survive calibration";
  ASSERT_EQ(detections.size(), 1u);
  EXPECT_EQ(detections[0].score, 0.6f);
}

}  // namespace
}  // namespace tavilib
