#include "alignment/sdm_model.h"

#include <fstream>

namespace SDMCore {
namespace {

const int32_t kDefaultStageLevels[10] = {2, 2, 1, 1, 0, 0, 0, 0, 0, 0};

void readInt32(std::istream& stream, int32_t& value) {
  stream.read(reinterpret_cast<char*>(&value), sizeof value);
}

void writeInt32(std::ostream& stream, int32_t value) {
  stream.write(reinterpret_cast<const char*>(&value), sizeof value);
}

template <typename Record>
void writeRecords(std::ostream& stream, const std::vector<Record>& records) {
  writeInt32(stream, static_cast<int32_t>(records.size()));
  for (const Record& record : records) record.write(stream);
}

template <typename Value>
void writeValues(std::ostream& stream, const std::vector<Value>& values) {
  writeInt32(stream, static_cast<int32_t>(values.size()));
  stream.write(reinterpret_cast<const char*>(values.data()),
               static_cast<std::streamsize>(values.size() * sizeof(Value)));
}

}  // namespace

SDMModel* sdmModel = nullptr;

SDMModel::SDMModel()
    : stageLevels(std::begin(kDefaultStageLevels), std::end(kDefaultStageLevels)),
      scalesPerOctave(3),
      faceWidth(100),
      modelFlag(1) {}

bool readSDMModel(const std::string& path, SDMModel& model) {
  std::ifstream stream(path, std::ios::in | std::ios::binary);
  if (!stream.is_open()) {
    stream.close();
    return false;
  }
  const size_t no_limit = static_cast<size_t>(-1);
  // One count variable serves the first five sections; a failed read leaves it
  // at its earlier value.
  int32_t count = 0;

  readInt32(stream, count);
  model.stageMatrices.resize(count);
  for (int32_t i = 0; i < count; ++i) model.stageMatrices[i].read(stream, no_limit);

  readInt32(stream, count);
  model.stageBiases.resize(count);
  for (int32_t i = 0; i < count; ++i) model.stageBiases[i].read(stream, no_limit);

  readInt32(stream, count);
  model.meanShape.resize(count);
  stream.read(reinterpret_cast<char*>(model.meanShape.data()),
              static_cast<std::streamsize>(count) * 4);

  readInt32(stream, count);
  model.auxShape.resize(count);
  stream.read(reinterpret_cast<char*>(model.auxShape.data()),
              static_cast<std::streamsize>(count) * 4);

  readInt32(stream, count);
  model.stageMaps.resize(count);
  for (int32_t i = 0; i < count; ++i) model.stageMaps[i].read(stream, no_limit);

  int32_t level_count = 0;
  readInt32(stream, level_count);
  model.stageLevels.resize(level_count);
  stream.read(reinterpret_cast<char*>(model.stageLevels.data()),
              static_cast<std::streamsize>(level_count) * 4);

  int32_t unused = 0;
  readInt32(stream, unused);
  readInt32(stream, model.modelFlag);
  readInt32(stream, model.scalesPerOctave);
  readInt32(stream, model.faceWidth);

  stream.close();
  return true;
}

bool writeSDMModel(std::ostream& stream, const SDMModel& model) {
  writeRecords(stream, model.stageMatrices);
  writeRecords(stream, model.stageBiases);
  writeValues(stream, model.meanShape);
  writeValues(stream, model.auxShape);
  writeRecords(stream, model.stageMaps);
  writeValues(stream, model.stageLevels);
  for (int32_t value : {0, model.modelFlag, model.scalesPerOctave, model.faceWidth}) {
    writeInt32(stream, value);
  }
  return static_cast<bool>(stream);
}

}  // namespace SDMCore
