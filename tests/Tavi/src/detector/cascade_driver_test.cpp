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
      CascadeStage stage;
      stage.threshold = threshold;
      state.stages.push_back(stage);
    }
    state.ready = true;
  }

  CascadeSteps steps() {
    CascadeSteps steps;
    steps.scan = [this](const cv::Mat& image, const CascadeParameter&, CascadeStage& first) {
      EXPECT_EQ(&first, &state.stages[0]);
      scannedSize = image.size();
      log.emplace_back("scan", std::vector<Window>());
      return PyramidScan{scanWindows, baseScale};
    };
    steps.grade = [this](std::vector<Window> windows, CascadeStage& stage, const cv::Mat&) {
      const size_t s = static_cast<size_t>(&stage - state.stages.data());
      log.emplace_back("grade" + std::to_string(s), windows);
      for (Window& w : windows) {
        w.score = scoreAtStage[s][w.x];
      }
      return windows;
    };
    steps.calibrate = [this](std::vector<Window> windows, CascadeStage& calibration,
                             const cv::Mat&) {
      EXPECT_EQ(&calibration, &state.calibration);
      log.emplace_back("calibrate", windows);
      for (Window& w : windows) {
        auto moved = calibratedX.find(w.x);
        if (moved != calibratedX.end()) {
          w.x = moved->second;
        }
      }
      return windows;
    };
    return steps;
  }

  std::vector<std::string> callNames() const {
    std::vector<std::string> names;
    for (const auto& entry : log) {
      names.push_back(entry.first);
    }
    return names;
  }

  DetectorState state;
  std::vector<Window> scanWindows;
  float baseScale = 1.0f;
  std::map<size_t, std::map<int, float>> scoreAtStage;
  std::map<int, int> calibratedX;
  std::vector<std::pair<std::string, std::vector<Window>>> log;
  cv::Size scannedSize;
};

struct TestImage {
  TestImage(int width, int height, int stride)
      : pixels(static_cast<size_t>(stride ? stride : width * 3) * height, 0),
        image{width, height, stride, pixels.data()} {}
  std::vector<unsigned char> pixels;
  Image image;
};

const CascadeParameter kParams{1.0f, 320, 0.05f, 3, 1.5f, 12};

TEST(CascadeDriverTest, StateThatIsNotReadyGivesMinusSixAndTouchesNothing) {
  FakeCascade cascade({0.5f});
  cascade.state.ready = false;
  TestImage input(40, 30, 0);
  std::vector<Detection> detections(2);
  EXPECT_EQ(runCascade(input.image, cascade.state, detections, kParams, cascade.steps()),
            STATUS_DETECTOR_NOT_READY);
  EXPECT_EQ(detections.size(), 2u);
  EXPECT_TRUE(cascade.log.empty());
}

TEST(CascadeDriverTest, OneStageScalesBackSortsThresholdsAndMergesFinally) {
  FakeCascade cascade({0.4f});
  // The worked pyramid example: a base scale of 0.15 brings the last windows of
  // levels 0 and 1 to (1513, 1113, 80) and (1466, 1066, 120).
  cascade.baseScale = 0.15f;
  cascade.scanWindows = {makeWindow(227, 167, 12, 0.5f), makeWindow(0, 0, 12, 0.4f),
                         makeWindow(30, 0, 12, 0.9f), makeWindow(31, 0, 12, 0.8f)};
  TestImage input(1600, 1200, 1600 * 3 + 7);
  std::vector<Detection> detections(1);
  detections[0].score = -1.0f;

  ASSERT_EQ(runCascade(input.image, cascade.state, detections, kParams, cascade.steps()),
            STATUS_OK);
  EXPECT_EQ(cascade.scannedSize, cv::Size(1600, 1200));
  EXPECT_EQ(cascade.callNames(), (std::vector<std::string>{"scan"}));

  // A second call appends its own list behind the first.
  cascade.scanWindows = {makeWindow(220, 160, 18, 0.45f)};
  ASSERT_EQ(runCascade(input.image, cascade.state, detections, kParams, cascade.steps()),
            STATUS_OK);

  // Appended behind the old entry; 0.4 is not above the threshold; (31, 0)
  // overlaps (30, 0); each list is best first.
  ASSERT_EQ(detections.size(), 4u);
  EXPECT_EQ(detections[0].score, -1.0f);
  EXPECT_EQ(detections[1].score, 0.9f);
  EXPECT_EQ(detections[2].score, 0.5f);
  EXPECT_EQ(detections[3].score, 0.45f);
  EXPECT_EQ(detections[1].box.left, 200.0f);  // 30 / 0.15 truncated
  EXPECT_EQ(detections[2].box.left, 1513.0f);
  EXPECT_EQ(detections[2].box.top, 1113.0f);
  EXPECT_EQ(detections[2].box.right, 1593.0f);
  EXPECT_EQ(detections[2].box.bottom, 1193.0f);
  EXPECT_EQ(detections[3].box.left, 1466.0f);
  EXPECT_EQ(detections[3].box.top, 1066.0f);
  EXPECT_EQ(detections[3].box.right, 1586.0f);
}

TEST(CascadeDriverTest, TwoStagesGradeWithoutCalibrationOrPerSizeMerge) {
  FakeCascade cascade({0.5f, 0.7f});
  cascade.scanWindows = {makeWindow(0, 0, 10, 0.6f), makeWindow(100, 0, 10, 0.55f),
                         makeWindow(200, 0, 10, 0.5f)};
  cascade.scoreAtStage[1] = {{0, 0.7f}, {100, 0.95f}};
  TestImage input(400, 100, 0);
  std::vector<Detection> detections;

  ASSERT_EQ(runCascade(input.image, cascade.state, detections, kParams, cascade.steps()),
            STATUS_OK);
  EXPECT_EQ(cascade.callNames(), (std::vector<std::string>{"scan", "grade1"}));
  // Stage 1 grades what passed stage 0, in score order.
  const std::vector<Window>& graded = cascade.log[1].second;
  ASSERT_EQ(graded.size(), 2u);
  EXPECT_EQ(graded[0].x, 0);
  EXPECT_EQ(graded[1].x, 100);
  ASSERT_EQ(detections.size(), 1u);
  EXPECT_EQ(detections[0].box.left, 100.0f);
  EXPECT_EQ(detections[0].score, 0.95f);
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
  TestImage input(200, 100, 0);
  std::vector<Detection> detections;

  ASSERT_EQ(runCascade(input.image, cascade.state, detections, kParams, cascade.steps()),
            STATUS_OK);
  EXPECT_EQ(cascade.callNames(), (std::vector<std::string>{"scan", "grade1", "calibrate", "grade2"}));
  EXPECT_EQ(cascade.log[2].second.size(), 3u) << "calibration sees windows below the threshold";
  const std::vector<Window>& lastGraded = cascade.log[3].second;
  ASSERT_EQ(lastGraded.size(), 1u) << "merged, then cut at 0.8";
  EXPECT_EQ(lastGraded[0].x, 1);
  EXPECT_EQ(lastGraded[0].score, 0.9f) << "scores from the grading stage survive calibration";
  ASSERT_EQ(detections.size(), 1u);
  EXPECT_EQ(detections[0].score, 0.6f);
}

TEST(CascadeDriverTest, FourStagesCalibrateOnlyBetweenFirstAndLast) {
  FakeCascade cascade({0.0f, 0.0f, 0.0f, 0.0f});
  cascade.scanWindows = {makeWindow(0, 0, 10, 0.5f)};
  for (size_t s = 1; s < 4; ++s) {
    cascade.scoreAtStage[s] = {{0, 0.5f}};
  }
  TestImage input(50, 50, 0);
  std::vector<Detection> detections;
  ASSERT_EQ(runCascade(input.image, cascade.state, detections, kParams, cascade.steps()),
            STATUS_OK);
  EXPECT_EQ(cascade.callNames(), (std::vector<std::string>{"scan", "grade1", "calibrate", "grade2",
                                                           "calibrate", "grade3"}));
  EXPECT_EQ(detections.size(), 1u);
}

TEST(CascadeDriverTest, NothingAboveTheFirstThresholdLeavesLaterStagesEmptyHanded) {
  FakeCascade cascade({0.5f, 0.5f, 0.5f});
  cascade.scanWindows = {makeWindow(0, 0, 10, 0.5f), makeWindow(20, 0, 10, 0.1f)};
  TestImage input(50, 50, 0);
  std::vector<Detection> detections;
  ASSERT_EQ(runCascade(input.image, cascade.state, detections, kParams, cascade.steps()),
            STATUS_OK);
  for (const auto& call : cascade.log) {
    EXPECT_TRUE(call.second.empty()) << call.first;
  }
  EXPECT_TRUE(detections.empty());
}

}  // namespace
}  // namespace tavilib
