#include "detector/cascade_loader.h"

#include <boost/thread/lock_guard.hpp>
#include <boost/thread/mutex.hpp>
#include <glog/logging.h>

#include <string>
#include <vector>

#include "detector/cascade_files.h"
#include "detector/default_cascade_tables.h"
#include "nn/net.h"
#include "nn/vision_layers.h"

namespace tavilib {

namespace {

// Serialises the building of nets across all loads of the process.
boost::mutex loadMutex;

using NetPointer = boost::shared_ptr<nn::Net<float>>;

// The net that runs over the whole image: primed, and its first layer must
// be a single-group convolution.
void primeFirstNet(nn::Net<float>& net) {
  net.FirstRun();
  auto* firstLayer = dynamic_cast<nn::ConvolutionLayer<float>*>(net.layers()[0].get());
  CHECK(firstLayer != nullptr) << "First Layer Should be Conv Layer.";
  firstLayer->CheckBinarization();
}

// An empty description (or a folder read as one) builds a net without input
// or output, which every later step would dereference.
void requireInputAndProbs(const nn::Net<float>& net, const std::string& description) {
  CHECK(!net.net_input_blobs().empty() && net.output_blob())
      << "Net description " << description << " has no input or no \"probs\" blob.";
}

CascadeStage loadBuiltInStage(const std::string& text, const std::string& weights,
                              const std::vector<double>& mean) {
  CascadeStage stage;
  stage.net.reset(new nn::Net<float>(text, nn::NetDescription::kText));
  requireInputAndProbs(*stage.net, "of the built-in cascade");
  stage.net->CopyTrainedLayersFrom(weights);
  stage.mean.assign(mean.begin(), mean.end());
  return stage;
}

}  // namespace

CascadeStage loadFullStage(const std::string& folder) {
  CascadeStage stage;
  stage.net.reset(new nn::Net<float>(folder + "/prototxt-full", nn::NetDescription::kFile));
  requireInputAndProbs(*stage.net, folder + "/prototxt-full");
  stage.net->CopyTrainedLayersFrom(folder + "/proto-full");
  primeFirstNet(*stage.net);
  return stage;
}

CascadeStage loadDeployStage(const std::string& folder) {
  CascadeStage stage;
  stage.net.reset(new nn::Net<float>(folder + "/prototxt-deploy", nn::NetDescription::kFile));
  requireInputAndProbs(*stage.net, folder + "/prototxt-deploy");
  stage.net->CopyTrainedLayersFrom(folder + "/proto");
  stage.mean = readMeanFile(folder + "/mean");
  return stage;
}

Status loadCascadeFromFolder(DetectorState& state, const DetectorParams& params) {
  boost::lock_guard<boost::mutex> lock(loadMutex);
  const std::string root = params.cascadeRoot;
  if (!state.stagesLoaded) {
    for (const CascadeListEntry& entry : readCascadeList(root + params.cascadeList)) {
      const std::string folder = root + entry.folder;
      state.stages.push_back(state.stages.empty() ? loadFullStage(folder)
                                                  : loadDeployStage(folder));
      state.stages.back().threshold = entry.threshold;
    }
    if (state.stages.empty()) {
      return STATUS_MODEL_LOAD_FAILED;
    }
    state.stagesLoaded = true;
  }
  if (!state.calibrationLoaded) {
    const std::string folder = root + kCalibrationFolder;
    state.calibration = loadDeployStage(folder);
    state.calibration.offsetsScales = readOffsetsScales(folder + "/offsets-scales");
    if (!state.calibration.net) {
      return STATUS_MODEL_LOAD_FAILED;
    }
    state.calibrationLoaded = true;
  }
  state.ready = true;
  return STATUS_OK;
}

Status loadBuiltInCascade(DetectorState& state) {
  boost::lock_guard<boost::mutex> lock(loadMutex);
  const DefaultCascadeTables tables;
  if (!state.stagesLoaded) {
    const std::vector<double> noMean;
    const std::string* texts[] = {&tables.stage0NetText, &tables.stage1NetText,
                                  &tables.stage2NetText};
    const std::vector<double>* means[] = {&noMean, &tables.stage1Mean, &tables.stage2Mean};
    for (size_t i = 0; i < 3; ++i) {
      state.stages.push_back(loadBuiltInStage(*texts[i], tables.stageWeightPaths[i], *means[i]));
      if (i == 0) {
        primeFirstNet(*state.stages[0].net);
      }
      state.stages.back().threshold = static_cast<float>(tables.thresholds[i]);
    }
    state.stagesLoaded = true;
  }
  if (!state.calibrationLoaded) {
    state.calibration = loadBuiltInStage(tables.calibrationNetText, tables.calibrationWeightPath,
                                         tables.calibrationMean);
    for (size_t i = 0; i < tables.offsetsX.size(); ++i) {
      state.calibration.offsetsScales.push_back(
          {tables.offsetsX[i], tables.offsetsY[i], static_cast<float>(tables.scales[i])});
    }
    state.calibrationLoaded = true;
  }
  state.ready = true;
  return STATUS_OK;
}

}  // namespace tavilib
