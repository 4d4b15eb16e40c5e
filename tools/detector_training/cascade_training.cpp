#include "detector_training/cascade_training.h"

#include <cblas.h>

#include <chrono>
#include <cstdio>
#include <filesystem>
#include <vector>

#include "detector/cascade_files.h"
#include "detector/cascade_loader.h"
#include "detector/cascade_net_texts.h"
#include "detector/default_cascade_tables.h"
#include "detector_training/model_folder.h"
#include "detector_training/net_trainer.h"
#include "detector_training/stage_windows.h"
#include "nn/util/io.h"

namespace training {

namespace fs = std::filesystem;

namespace {

// The scan net's declared input: a 1920 by 1080 photo searched for faces of
// 40 pixels has a base image of 576 by 324, and a 1024-pixel image searched
// for faces of 20 pixels one of 614 pixels.
constexpr int kScanInput = 640;
// Smallest faces sought while mining, in negative images and in face images.
constexpr int kMiningMinFace = 20;
constexpr int kMiningMinFaceInFaceImages = 24;
constexpr int kCalibrationWindowsPerFace = 3;

enum class Role { kScan, kGrader, kCalibration };

struct StagePlan {
  const char* folder;
  const char* text;
  Role role;
  float threshold;
  // Where the trained net best separates faces from the rest, as a face
  // probability: at export the face logit is raised so that the shipped
  // threshold falls there (the odds of the two differ by a constant factor).
  float decidesAt;
  int epochs;
  NetTrainingSettings settings;
  StageRecipe recipe;
};

std::vector<StagePlan> cascadeStages() {
  NetTrainingSettings scan;
  scan.batch = 128;
  scan.baseLr = 0.02f;
  scan.positiveWeight = 5.0f;
  NetTrainingSettings grader;
  grader.baseLr = 0.01f;
  grader.positiveWeight = 3.0f;
  NetTrainingSettings calibration;
  calibration.baseLr = 0.01f;
  NetTrainingSettings lastGrader = grader;
  lastGrader.baseLr = 0.005f;
  lastGrader.positiveWeight = 4.0f;
  return {
      {"cascades/x16Net-demo", tavilib::kStage0NetText, Role::kScan, 0.4f, 0.2f, 15, scan,
       {12, 2, {0.2f, 0.15f}, 60, 3, 0, 0, 0.0f}},
      {"cascades/x32Net", tavilib::kStage1NetText, Role::kGrader, 0.8f, 0.3f, 10, grader,
       {24, 2, {0.2f, 0.15f}, 10, 1, 40, 4, 0.5f}},
      {"cascades/x32Net-x32-3Scales-200", tavilib::kCalibrationNetText, Role::kCalibration, 0.0f, 0.0f, 40,
       calibration, {24, 0, {0.0f, 0.0f}, 0, 0, 0, 0, 0.0f}},
      {"cascades/x64Net", tavilib::kStage2NetText, Role::kGrader, 0.98f, 0.55f, 7, lastGrader,
       {48, 2, {0.1f, 0.1f}, 5, 1, 40, 4, 0.6f, 4, 0.45f}},
  };
}

std::vector<tavilib::OffsetScale> calibrationTable() {
  const tavilib::DefaultCascadeTables tables;
  std::vector<tavilib::OffsetScale> rows;
  for (size_t i = 0; i < tables.offsetsX.size(); ++i) {
    rows.push_back({tables.offsetsX[i], tables.offsetsY[i], static_cast<float>(tables.scales[i])});
  }
  return rows;
}

double secondsSince(std::chrono::steady_clock::time_point start) {
  return std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
}

// Every shrink-th item of each part of the data, for trial runs.
DetectorData thin(DetectorData data, int shrink) {
  if (shrink <= 1) {
    return data;
  }
  auto keepEvery = [shrink](auto& items) {
    size_t kept = 0;
    for (size_t i = 0; i < items.size(); i += static_cast<size_t>(shrink)) {
      items[kept++] = items[i];
    }
    items.resize(kept);
  };
  keepEvery(data.faces);
  keepEvery(data.crops);
  keepEvery(data.negatives);
  keepEvery(data.negativeFiles);
  return data;
}

nn::NetParameter deployDescription(const StagePlan& stage) {
  nn::NetParameter description;
  nn::ReadNetParamsFromText(stage.text, &description);
  if (stage.role == Role::kScan) {
    description.set_input_dim(2, kScanInput);
    description.set_input_dim(3, kScanInput);
  }
  return description;
}

WindowSet windowsOfEpoch(const DetectorData& data, const StagePlan& stage, unsigned seed) {
  WindowSampler sampler(stage.recipe.side, seed);
  if (stage.role == Role::kCalibration) {
    return drawCalibrationWindows(data, kCalibrationWindowsPerFace, calibrationTable(), sampler);
  }
  return drawPositives(data, stage.recipe, sampler);
}

// Pass rates at the stage's decision point (two-class nets) or the share of
// right classes (calibration).
void printValidation(NetTrainer& trainer, const WindowSet& validation, const StagePlan& stage) {
  const std::vector<std::vector<float>> probabilities = trainer.probabilities(validation);
  size_t passed[2] = {0, 0};
  size_t right = 0;
  size_t nan = 0;
  for (size_t i = 0; i < probabilities.size(); ++i) {
    const std::vector<float>& p = probabilities[i];
    const int label = validation.labels[i];
    const int best = static_cast<int>(std::max_element(p.begin(), p.end()) - p.begin());
    right += best == label;
    nan += std::isnan(p[0]);
    if (stage.role != Role::kCalibration) {
      passed[label] += p[1] > stage.decidesAt;
    }
  }
  if (stage.role == Role::kCalibration) {
    std::printf("  validation: %zu windows, right class %.4f\n", validation.size(),
                static_cast<double>(right) / static_cast<double>(validation.size()));
  } else {
    std::printf("  validation: faces passing %.4f of %zu, non-faces passing %.4f of %zu%s\n",
                static_cast<double>(passed[1]) / std::max<size_t>(validation.count(1), 1),
                validation.count(1),
                static_cast<double>(passed[0]) / std::max<size_t>(validation.count(0), 1),
                validation.count(0), nan > 0 ? " (NaN scores!)" : "");
  }
  std::fflush(stdout);
}

void addToCascade(tavilib::DetectorState& soFar, const StagePlan& stage,
                  const std::string& folder) {
  switch (stage.role) {
    case Role::kScan:
      soFar.stages.push_back(tavilib::loadFullStage(folder));
      soFar.stages.back().threshold = stage.threshold;
      break;
    case Role::kGrader:
      soFar.stages.push_back(tavilib::loadDeployStage(folder));
      soFar.stages.back().threshold = stage.threshold;
      break;
    case Role::kCalibration:
      soFar.calibration = tavilib::loadDeployStage(folder);
      soFar.calibration.offsetsScales = tavilib::readOffsetsScales(folder + "/offsets-scales");
      break;
  }
}

void trainStage(const StagePlan& stage, unsigned stageSeed, const DetectorData& train,
                const DetectorData& validation, std::vector<tavilib::DetectorState>& soFar,
                const std::string& folder, const std::string& snapshots, int shrink,
                int threads) {
  const auto start = std::chrono::steady_clock::now();
  openblas_set_num_threads(1);
  const FixedWindowScan scan{kMiningMinFace, kMiningMinFaceInFaceImages, kScanInput};
  const WindowSet fixed = drawFixedWindows(train, stage.recipe, soFar, scan, stageSeed);
  WindowSet validationSet = windowsOfEpoch(validation, stage, stageSeed + 2);
  validationSet.append(drawFixedWindows(validation, stage.recipe, soFar, scan, stageSeed + 1));
  WindowSet first = windowsOfEpoch(train, stage, stageSeed + 100);
  first.append(fixed);
  std::printf("  windows: %zu fixed (%zu faces among them), %zu drawn per epoch, %zu to validate "
              "(%.0f s)\n",
              fixed.size(), fixed.count(1), first.size() - fixed.size(), validationSet.size(),
              secondsSince(start));
  std::fflush(stdout);

  StageFiles files;
  files.fullForm = stage.role == Role::kScan;
  files.description = deployDescription(stage);
  files.mean = planeMean(first);
  // The scan net sees raw pixels; it learns on them minus the priming value.
  const std::vector<float> trainingMean =
      files.fullForm ? std::vector<float>(files.mean.size(), 100.0f) : files.mean;

  const int epochs = std::max(1, stage.epochs / shrink);
  NetTrainingSettings settings = stage.settings;
  settings.seed = stageSeed;
  settings.lrGamma = 0.3f;
  settings.lrStepIterations =
      std::max(1, static_cast<int>(first.size()) / settings.batch * std::max(1, epochs / 3));
  NetTrainer trainer(stage.text, stage.recipe.side, files.fullForm, settings, trainingMean);
  fs::create_directories(snapshots);
  const int done = trainer.resume(snapshots);
  if (done > 0) {
    std::printf("  resumed after epoch %d\n", done);
  }
  for (int epoch = done; epoch < epochs; ++epoch) {
    openblas_set_num_threads(threads);
    WindowSet set = epoch == 0 ? first : windowsOfEpoch(train, stage, stageSeed + 100 + epoch);
    if (epoch != 0) {
      set.append(fixed);
    }
    const EpochFigures figures = trainer.trainEpoch(set, epoch);
    openblas_set_num_threads(1);
    std::printf("  epoch %d/%d: loss %.4f, accuracy %.4f (%.0f s)\n", epoch + 1, epochs,
                figures.loss, figures.accuracy, secondsSince(start));
    printValidation(trainer, validationSet, stage);
    trainer.snapshot(snapshots, epoch + 1);
  }
  if (done == epochs) {
    printValidation(trainer, validationSet, stage);
  }
  files.weights = trainer.deployWeights();
  if (stage.decidesAt != stage.threshold) {
    raiseFaceLogit(files.weights, logOdds(stage.threshold) - logOdds(stage.decidesAt));
  }
  if (stage.role == Role::kCalibration) {
    files.offsetsScales = calibrationTable();
  }
  writeStageFolder(folder, files);
  std::printf("  written to %s (%.0f s)\n", folder.c_str(), secondsSince(start));
}

std::string listFileText(const std::vector<StagePlan>& stages) {
  std::string text = "# The trained cascade: scan, 24-pixel grader, 48-pixel grader.\n";
  for (const StagePlan& stage : stages) {
    if (stage.role != Role::kCalibration) {
      char threshold[32];
      std::snprintf(threshold, sizeof threshold, "%g", static_cast<double>(stage.threshold));
      text += std::string(stage.folder) + " " + threshold + "\n";
    }
  }
  return text;
}

}  // namespace

void trainCascade(const CascadeTrainingOptions& options) {
  const auto start = std::chrono::steady_clock::now();
  std::printf("reading %s\n", options.dataRoot.c_str());
  std::fflush(stdout);
  const DetectorData train = thin(loadTrainingData(options.dataRoot), options.shrink);
  const DetectorData validation = thin(loadValidationData(options.dataRoot), options.shrink);
  std::printf("training: %zu face images, %zu face crops, %zu negative images; validation: %zu "
              "face images, %zu negative images (%.0f s)\n",
              train.faces.size(), train.crops.size(), train.negatives.size(),
              validation.faces.size(), validation.negatives.size(), secondsSince(start));

  const std::vector<StagePlan> stages = cascadeStages();
  // The cascade so far, once for each worker of the mining.
  std::vector<tavilib::DetectorState> soFar(static_cast<size_t>(options.threads));
  for (size_t s = 0; s < stages.size(); ++s) {
    const StagePlan& stage = stages[s];
    const std::string folder = options.workFolder + "/model/" + stage.folder;
    std::printf("stage %zu of %zu: %s\n", s + 1, stages.size(), stage.folder);
    std::fflush(stdout);
    if (fs::exists(folder)) {
      std::printf("  trained before, kept\n");
    } else {
      trainStage(stage, options.seed * 1000u + static_cast<unsigned>(s), train, validation, soFar,
                 folder, options.workFolder + "/snapshots/" + fs::path(stage.folder).filename().string(),
                 options.shrink, options.threads);
    }
    for (tavilib::DetectorState& copy : soFar) {
      addToCascade(copy, stage, folder);
    }
  }

  for (const StagePlan& stage : stages) {
    copyStageFolder(options.workFolder + "/model/" + stage.folder,
                    options.outputRoot + stage.folder);
  }
  writeFileAtomically(options.outputRoot + "cascade.list", listFileText(stages));
  std::printf("model folder written to %s (list file cascade.list); wall time %.0f s\n",
              options.outputRoot.c_str(), secondsSince(start));
}

}  // namespace training
