#include "alignment/sdm_model_check.h"

#include <cmath>
#include <cstdint>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <vector>

#include "tavilib.h"

namespace SDMCore {

namespace {

constexpr int64_t kPoints = 68;
constexpr int64_t kDescriptorLength = 128;
// Bounds that keep every shape the stages can produce far inside the ranges
// of the integer casts of the descriptor and the padding: stage values (map
// means, projections, biases) up to 1e6, mean-shape points within four box
// sizes of the box's centre.
constexpr float kLargest = 1e6f;
constexpr float kMeanShapeReach = 4.0f;

// Reads the file's sections in order; a read past the end marks it short.
class LayoutWalk {
 public:
  explicit LayoutWalk(std::string bytes) : bytes_(std::move(bytes)) {}

  bool shortOfBytes() const { return short_; }
  // Whether a matrix read with its values checked held one beyond kLargest.
  bool wildValues() const { return wild_; }
  size_t left() const { return bytes_.size() - at_; }

  int32_t int32() { return take<int32_t>(); }
  // The count of a list of records; a negative one counts as short.
  int32_t count() {
    const int32_t value = take<int32_t>();
    short_ = short_ || value < 0;
    return value;
  }

  // A matrix record's dimensions, its elements checked or skipped. Negative
  // dimensions count as short.
  void matrix(int64_t& rows, int64_t& columns, bool checkValues) {
    rows = take<int64_t>();
    columns = take<int64_t>();
    if (rows < 0 || columns < 0 || (columns > 0 && rows > static_cast<int64_t>(left()) / 4 / columns)) {
      short_ = true;
      return;
    }
    const size_t count = static_cast<size_t>(rows * columns);
    for (size_t i = 0; checkValues && i < count; ++i) {
      float value = 0.0f;
      std::memcpy(&value, bytes_.data() + at_ + 4 * i, 4);
      wild_ = wild_ || !(std::fabs(value) <= kLargest);
    }
    at_ += count * 4;
  }

  // A list of count 4-byte values.
  template <typename Value>
  std::vector<Value> values(int32_t count) {
    if (count < 0 || static_cast<size_t>(count) > left() / 4) {
      short_ = true;
      return {};
    }
    std::vector<Value> values(static_cast<size_t>(count));
    if (!values.empty()) {
      std::memcpy(values.data(), bytes_.data() + at_, values.size() * 4);
      at_ += values.size() * 4;
    }
    return values;
  }

 private:
  template <typename Value>
  Value take() {
    Value value{};
    if (short_ || left() < sizeof value) {
      short_ = true;
      return value;
    }
    std::memcpy(&value, bytes_.data() + at_, sizeof value);
    at_ += sizeof value;
    return value;
  }

  std::string bytes_;
  size_t at_ = 0;
  bool short_ = false;
  bool wild_ = false;
};

std::string layoutFault(LayoutWalk& walk, SDMCheck check) {
  const bool for68 = check == SDMCheck::kUsableFor68Points;
  int64_t rows = 0;
  int64_t columns = 0;
  for (int section = 0; section < 2; ++section) {  // stage matrices, stage biases
    const int32_t count = walk.count();
    for (int32_t i = 0; i < count && !walk.shortOfBytes(); ++i) walk.matrix(rows, columns, section == 1);
  }
  const std::vector<float> meanShape = walk.values<float>(walk.int32());
  walk.values<float>(walk.int32());
  if (walk.shortOfBytes()) return "cut short before its stages";
  const int64_t points = static_cast<int64_t>(meanShape.size()) / 2;
  if (meanShape.size() % 2 != 0) return "the mean shape has an odd length";
  if (for68 && points != kPoints) return "the mean shape needs 68 points";
  for (float value : meanShape) {
    if (!(std::fabs(value - 0.5f) <= kMeanShapeReach)) return "the mean shape reaches beyond four box sizes";
  }
  const int32_t stages = walk.count();
  if (for68 && stages < 1) return "no stage";
  const int64_t features = points * kDescriptorLength;
  for (int32_t i = 0; i < stages && !walk.shortOfBytes(); ++i) {
    walk.matrix(rows, columns, true);
    const bool meanFits = rows == 1 && columns == features;
    walk.matrix(rows, columns, true);
    if (!walk.shortOfBytes() && !(meanFits && rows == features && columns == 2 * points)) {
      return "stage " + std::to_string(i + 1) + " needs a 1 by " + std::to_string(features) +
             " mean and a " + std::to_string(features) + " by " + std::to_string(2 * points) + " map";
    }
  }
  const std::vector<int32_t> levels = walk.values<int32_t>(walk.int32());
  walk.int32();  // not used
  walk.int32();  // model flag
  const int32_t scalesPerOctave = walk.int32();
  const int32_t faceWidth = walk.int32();
  if (walk.shortOfBytes()) return "cut short";
  if (walk.wildValues()) return "a stage holds a value that is not finite or beyond 1e6";
  if (for68 && walk.left() != 0) return std::to_string(walk.left()) + " bytes after the model";
  if (scalesPerOctave < 1 || scalesPerOctave > 16) return "scales per octave must be 1 to 16";
  if (faceWidth < 8 || faceWidth > 1024) return "the face width must be 8 to 1024 pixels";
  for (int32_t level : levels) {
    if (level < 0 || level > scalesPerOctave + 2) {
      return "a stage level outside 0 to " + std::to_string(scalesPerOctave + 2);
    }
  }
  return {};
}

}  // namespace

std::string sdmFileFault(const std::string& path, SDMCheck check) {
  std::error_code error;
  if (!std::filesystem::is_regular_file(path, error)) return path + ": missing or not a file";
  std::ifstream file(path, std::ios::binary);
  LayoutWalk walk(std::string((std::istreambuf_iterator<char>(file)), std::istreambuf_iterator<char>()));
  const std::string fault = layoutFault(walk, check);
  return fault.empty() ? fault : path + ": " + fault;
}

}  // namespace SDMCore

namespace tavilib {

Status checkSDMModel(const std::string& folder, const std::string& file, std::string& message) {
  message = SDMCore::sdmFileFault(folder + "/" + file, SDMCore::SDMCheck::kUsableFor68Points);
  return message.empty() ? STATUS_OK : STATUS_MODEL_LOAD_FAILED;
}

}  // namespace tavilib
