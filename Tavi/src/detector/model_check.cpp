#include "detector/model_check.h"

#include <algorithm>
#include <cmath>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <map>
#include <set>
#include <sstream>

#include "detector/cascade_files.h"
#include "nn/net.h"
#include "nn/util/io.h"
#include "nn/util/upgrade_proto.h"

namespace tavilib {

namespace {

namespace fs = std::filesystem;
using nn::LayerParameter;

// Layers that can run in a detection net: no data sources, no losses.
const std::set<LayerParameter::LayerType> kInferenceLayers = {
    LayerParameter::BNLL,    LayerParameter::CONCAT,      LayerParameter::CONVOLUTION,
    LayerParameter::DROPOUT, LayerParameter::ELTWISE_PRODUCT, LayerParameter::FLATTEN,
    LayerParameter::IM2COL,  LayerParameter::INNER_PRODUCT, LayerParameter::LRN,
    LayerParameter::POOLING, LayerParameter::POWER,       LayerParameter::RELU,
    LayerParameter::SIGMOID, LayerParameter::SOFTMAX,     LayerParameter::SPLIT,
    LayerParameter::TANH};

// The whole file, or a fault naming it.
std::string readWhole(const std::string& path, std::string& fault) {
  std::error_code error;
  if (!fs::is_regular_file(path, error)) {
    fault = path + ": missing or not a file";
    return {};
  }
  std::ifstream file(path, std::ios::binary);
  std::string text((std::istreambuf_iterator<char>(file)), std::istreambuf_iterator<char>());
  if (!file.good() && !file.eof()) {
    fault = path + ": cannot be read";
  }
  return text;
}

// The description, in the current form, or a fault. Layers must be of kinds
// that run at inference and read only blobs made before them, so that the
// engine assembles the net without ending the process.
std::string readDescription(const std::string& path, nn::NetParameter& description) {
  std::string fault;
  const std::string text = readWhole(path, fault);
  if (!fault.empty()) {
    return fault;
  }
  if (!nn::ReadProtoFromTextFile1(text, &description)) {
    return path + ": not a network description";
  }
  if (nn::NetParameterIsV0(description)) {
    return path + ": a description of the old generation; convert it with upgrade_net_proto_text";
  }
  if (description.input_size() != 1 || description.input_dim_size() != 4) {
    return path + ": needs exactly one input of four dimensions";
  }
  for (int i = 0; i < 4; ++i) {
    if (description.input_dim(i) < 1) {
      return path + ": an input dimension below 1";
    }
  }
  std::set<std::string> made = {description.input(0)};
  for (const LayerParameter& layer : description.layers()) {
    if (kInferenceLayers.count(layer.type()) == 0) {
      return path + ": layer \"" + layer.name() + "\" is of a kind that has no place in a detection net";
    }
    for (const std::string& bottom : layer.bottom()) {
      if (made.count(bottom) == 0) {
        return path + ": layer \"" + layer.name() + "\" reads \"" + bottom + "\", which no earlier layer makes";
      }
    }
    made.insert(layer.top().begin(), layer.top().end());
  }
  if (made.count("probs") == 0) {
    return path + ": no blob named \"probs\"";
  }
  return {};
}

// The weights must hold, for every layer of net with parameters, blobs of
// the shapes the net gives them.
std::string weightsFault(const std::string& path, const nn::Net<float>& net) {
  std::string fault;
  const std::string bytes = readWhole(path, fault);
  if (!fault.empty()) {
    return fault;
  }
  nn::NetParameter weights;
  if (!weights.ParseFromString(bytes)) {
    return path + ": not a weight file";
  }
  if (nn::NetParameterIsV0(weights)) {
    return path + ": weights of the old generation; convert them with upgrade_net_proto_binary";
  }
  std::map<std::string, const LayerParameter*> byName;
  for (const LayerParameter& layer : weights.layers()) {
    byName[layer.name()] = &layer;
  }
  for (size_t i = 0; i < net.layers().size(); ++i) {
    const auto& blobs = net.layers()[i]->blobs();
    if (blobs.empty()) {
      continue;
    }
    const std::string& name = net.layer_names()[i];
    const auto found = byName.find(name);
    if (found == byName.end()) {
      return path + ": no weights for layer \"" + name + "\"";
    }
    const LayerParameter& stored = *found->second;
    if (stored.blobs_size() != static_cast<int>(blobs.size())) {
      return path + ": layer \"" + name + "\" has " + std::to_string(stored.blobs_size()) +
             " blobs where its description gives " + std::to_string(blobs.size());
    }
    for (size_t b = 0; b < blobs.size(); ++b) {
      const nn::BlobProto& blob = stored.blobs(static_cast<int>(b));
      const nn::Blob<float>& expected = *blobs[b];
      if (blob.num() != expected.num() || blob.channels() != expected.channels() ||
          blob.height() != expected.height() || blob.width() != expected.width() ||
          blob.data_size() != expected.count()) {
        return path + ": blob " + std::to_string(b) + " of layer \"" + name +
               "\" is not of the shape its description gives";
      }
    }
  }
  return {};
}

std::string meanFault(const std::string& path, const nn::Net<float>& net) {
  std::string fault;
  const std::string text = readWhole(path, fault);
  if (!fault.empty()) {
    return fault;
  }
  if (text.empty() || !std::isspace(static_cast<unsigned char>(text.back()))) {
    return path + ": must end in white space, or its last number is lost";
  }
  const size_t count = readMeanFile(path).size();
  const nn::Blob<float>& input = *net.net_input_blobs()[0];
  const size_t expected = static_cast<size_t>(input.channels() * input.height() * input.width());
  if (count != expected) {
    return path + ": holds " + std::to_string(count) + " numbers where the net's input has " +
           std::to_string(expected);
  }
  return {};
}

std::string tableFault(const std::string& path, const nn::Net<float>& net) {
  std::string fault;
  readWhole(path, fault);
  if (!fault.empty()) {
    return fault;
  }
  const std::vector<OffsetScale> table = readOffsetsScales(path);
  const int classes = net.output_blob()->count() / net.output_blob()->num();
  if (table.empty() || static_cast<int>(table.size()) > classes) {
    return path + ": needs 1 to " + std::to_string(classes) + " rows, one per class of the net";
  }
  const int width = net.declared_input_width();
  const int height = net.declared_input_height();
  for (size_t k = 0; k < table.size(); ++k) {
    const OffsetScale& row = table[k];
    if (!(std::isfinite(row.scale) && row.scale >= 0.01f && row.scale <= 100.0f) ||
        std::abs(static_cast<int64_t>(row.offsetX)) > width ||
        std::abs(static_cast<int64_t>(row.offsetY)) > height) {
      return path + ": row " + std::to_string(k + 1) +
             " needs a scale from 0.01 to 100 and offsets within the net's input";
    }
  }
  return {};
}

enum class Form { kFull, kDeploy, kCalibration };

std::string stageFault(const std::string& folder, Form form) {
  const bool full = form == Form::kFull;
  nn::NetParameter description;
  const std::string descriptionPath = folder + (full ? "/prototxt-full" : "/prototxt-deploy");
  std::string fault = readDescription(descriptionPath, description);
  if (!fault.empty()) {
    return fault;
  }
  if (full && (description.layers_size() == 0 ||
               description.layers(0).type() != LayerParameter::CONVOLUTION ||
               description.layers(0).convolution_param().group() != 1)) {
    return descriptionPath + ": the scan net must begin with a convolution of one group";
  }
  const nn::Net<float> net(description);
  const nn::Blob<float>& probs = *net.output_blob();
  if (form != Form::kCalibration && probs.count() / probs.num() < 2) {
    return descriptionPath + ": \"probs\" needs two classes, face being the second";
  }
  fault = weightsFault(folder + (full ? "/proto-full" : "/proto"), net);
  if (fault.empty() && !full) {
    fault = meanFault(folder + "/mean", net);
  }
  if (fault.empty() && form == Form::kCalibration) {
    fault = tableFault(folder + "/offsets-scales", net);
  }
  return fault;
}

std::string listFault(const std::string& path, std::vector<CascadeListEntry>& entries) {
  std::string fault;
  const std::string text = readWhole(path, fault);
  if (!fault.empty()) {
    return fault;
  }
  if (text.find('\0') != std::string::npos) {
    return path + ": holds a NUL byte";
  }
  if (!text.empty() && text.back() != '\n') {
    return path + ": the last line has no newline and would be ignored";
  }
  std::istringstream lines(text);
  int number = 0;
  for (std::string line; std::getline(lines, line);) {
    ++number;
    if (!line.empty() && line[0] == '#') {
      continue;
    }
    std::istringstream fields(line);
    CascadeListEntry entry{std::string(), 0.0f};
    if (!(fields >> entry.folder >> entry.threshold) || !std::isfinite(entry.threshold)) {
      return path + ":" + std::to_string(number) + ": needs a stage folder and a threshold";
    }
    entries.push_back(entry);
  }
  if (entries.empty()) {
    return path + ": names no stage";
  }
  return {};
}

}  // namespace

std::string cascadeFolderFault(const std::string& root, const std::string& list) {
  std::vector<CascadeListEntry> entries;
  std::string fault = listFault(root + list, entries);
  for (size_t i = 0; fault.empty() && i < entries.size(); ++i) {
    fault = stageFault(root + entries[i].folder, i == 0 ? Form::kFull : Form::kDeploy);
  }
  if (fault.empty()) {
    fault = stageFault(root + kCalibrationFolder, Form::kCalibration);
  }
  return fault;
}

Status checkDetectorModel(const DetectorParams& params, std::string& message) {
  message = cascadeFolderFault(params.cascadeRoot, params.cascadeList);
  return message.empty() ? STATUS_OK : STATUS_MODEL_LOAD_FAILED;
}

}  // namespace tavilib
