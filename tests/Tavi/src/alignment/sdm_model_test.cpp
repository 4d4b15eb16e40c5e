#include "alignment/sdm_model.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <sstream>
#include <string>
#include <vector>

#include "temp_dir.h"

namespace SDMCore {
namespace {

mp::matrix Sequence(int rows, int columns, float start) {
  mp::matrix m(rows, columns);
  for (int64_t i = 0; i < m.size(); ++i) m.data()[i] = start + static_cast<float>(i);
  return m;
}

std::string Bytes(const SDMModel& model) {
  std::ostringstream out;
  EXPECT_TRUE(writeSDMModel(out, model));
  return out.str();
}

std::string Int32s(std::vector<int32_t> values) {
  return std::string(reinterpret_cast<const char*>(values.data()), values.size() * 4);
}

TEST(SdmModelTest, WrittenModelReadsBackWholeAndATailIsIgnored) {
  SDMModel written;
  written.stageMatrices.push_back(Sequence(1, 1, 0.0f));
  written.stageBiases = {Sequence(1, 4, 10.0f), Sequence(1, 4, 20.0f)};
  written.meanShape = {0.25f, 0.5f, 0.75f, 0.5f};
  written.auxShape = {1.0f, 2.0f, 3.0f};
  written.stageMaps.resize(2);
  written.stageMaps[1].mean = Sequence(1, 256, 1.0f);
  written.stageMaps[1].projection = Sequence(256, 4, -1.0f);
  written.stageLevels = {1, 0};
  written.modelFlag = 5;
  written.scalesPerOctave = 4;
  written.faceWidth = 120;
  TempDir dir;
  SDMModel model;
  ASSERT_TRUE(readSDMModel(dir.write("model.bin", Bytes(written) + "xy"), model));
  EXPECT_EQ(Bytes(model), Bytes(written));
  EXPECT_EQ(model.meanShape, written.meanShape);
  EXPECT_EQ(model.stageLevels, written.stageLevels);
}

// Six zero counts, the discarded integer, flag, scales per octave, width:
// a model without lists, which writes back as it was read but for the
// discarded integer.
TEST(SdmModelTest, FortyByteFileWithAllCountsZeroIsAModelWithoutLists) {
  TempDir dir;
  SDMModel model;
  ASSERT_TRUE(readSDMModel(dir.write("empty.bin", Int32s({0, 0, 0, 0, 0, 0, 9, 2, 5, 80})), model));
  EXPECT_TRUE(model.stageMaps.empty());
  EXPECT_TRUE(model.stageLevels.empty());
  EXPECT_EQ(model.modelFlag, 2);
  EXPECT_EQ(model.scalesPerOctave, 5);
  EXPECT_EQ(model.faceWidth, 80);
  EXPECT_EQ(Bytes(model), Int32s({0, 0, 0, 0, 0, 0, 0, 2, 5, 80}));
}

// A missing file leaves the defaults. An empty one is read: every read fails,
// the counts stay 0 and the settings keep their defaults.
TEST(SdmModelTest, OnlyAMissingFileIsRefused) {
  SDMModel missing;
  EXPECT_FALSE(readSDMModel("/nonexistent/tavi/model.bin", missing));
  EXPECT_EQ(missing.stageLevels, (std::vector<int32_t>{2, 2, 1, 1, 0, 0, 0, 0, 0, 0}));
  EXPECT_EQ(missing.faceWidth, 100);
  TempDir dir;
  SDMModel empty;
  ASSERT_TRUE(readSDMModel(dir.write("empty.bin", ""), empty));
  EXPECT_EQ(empty.scalesPerOctave, 3);
  EXPECT_TRUE(empty.stageLevels.empty());
}

}  // namespace
}  // namespace SDMCore
