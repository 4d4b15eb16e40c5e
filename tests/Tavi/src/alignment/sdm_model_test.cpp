#include "alignment/sdm_model.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <string>
#include <vector>

#include "model_file.h"
#include "temp_dir.h"

namespace SDMCore {
namespace {

using testing_support::ModelBytes;
using testing_support::ModelContents;
using testing_support::PutInt32;

std::string Int32Bytes(std::vector<int32_t> values) {
  return std::string(reinterpret_cast<const char*>(values.data()), values.size() * 4);
}

mp::matrix Sequence(int rows, int columns, float start) {
  mp::matrix m(rows, columns);
  for (int64_t i = 0; i < m.size(); ++i) m.data()[i] = start + static_cast<float>(i);
  return m;
}

bool Same(const mp::matrix& a, const mp::matrix& b) {
  if (a.rows() != b.rows() || a.columns() != b.columns() || a.is_valid() != b.is_valid()) return false;
  for (int64_t i = 0; a.is_valid() && i < a.size(); ++i) {
    if (a.data()[i] != b.data()[i]) return false;
  }
  return true;
}

ModelContents FullModel() {
  ModelContents model;
  model.stageMatrices.push_back(Sequence(1, 1, 0.0f));
  model.stageBiases.push_back(Sequence(1, 4, 10.0f));
  model.stageBiases.push_back(Sequence(1, 4, 20.0f));
  model.meanShape = {0.25f, 0.5f, 0.75f, 0.5f};
  model.auxShape = {1.0f, 2.0f, 3.0f};
  for (int i = 0; i < 2; ++i) {
    mp::pca_map map;
    map.mean = Sequence(1, 256, static_cast<float>(i));
    map.projection = Sequence(256, 4, -static_cast<float>(i));
    model.stageMaps.push_back(map);
  }
  model.stageLevels = {1, 0};
  model.discarded = 77;
  model.modelFlag = 5;
  model.scalesPerOctave = 4;
  model.faceWidth = 120;
  return model;
}

TEST(SdmModelTest, DefaultsBeforeTheFileIsRead) {
  const SDMModel model;
  EXPECT_EQ(model.stageLevels, (std::vector<int32_t>{2, 2, 1, 1, 0, 0, 0, 0, 0, 0}));
  EXPECT_EQ(model.scalesPerOctave, 3);
  EXPECT_EQ(model.faceWidth, 100);
  EXPECT_EQ(model.modelFlag, 1);
  EXPECT_TRUE(model.meanShape.empty());
  EXPECT_TRUE(model.stageMaps.empty());
}

TEST(SdmModelTest, ReadsEverySectionInOrder) {
  TempDir dir;
  const ModelContents contents = FullModel();
  const std::string path = dir.write("model.bin", ModelBytes(contents));
  SDMModel model;
  ASSERT_TRUE(readSDMModel(path, model));
  ASSERT_EQ(model.stageMatrices.size(), 1u);
  EXPECT_TRUE(Same(model.stageMatrices[0], contents.stageMatrices[0]));
  ASSERT_EQ(model.stageBiases.size(), 2u);
  EXPECT_TRUE(Same(model.stageBiases[1], contents.stageBiases[1]));
  EXPECT_EQ(model.meanShape, contents.meanShape);
  EXPECT_EQ(model.auxShape, contents.auxShape);
  ASSERT_EQ(model.stageMaps.size(), 2u);
  EXPECT_TRUE(Same(model.stageMaps[1].mean, contents.stageMaps[1].mean));
  EXPECT_TRUE(Same(model.stageMaps[1].projection, contents.stageMaps[1].projection));
  EXPECT_EQ(model.stageLevels, contents.stageLevels);
  EXPECT_EQ(model.modelFlag, 5);
  EXPECT_EQ(model.scalesPerOctave, 4);
  EXPECT_EQ(model.faceWidth, 120);
}

TEST(SdmModelTest, FortyByteFileWithAllCountsZeroLoads) {
  TempDir dir;
  // Sections 1, 3, 5, 7, 9, 11 (counts 0), 13 (discarded), flag, S, width.
  const std::string bytes = Int32Bytes({0, 0, 0, 0, 0, 0, 9, 2, 5, 80});
  ASSERT_EQ(bytes.size(), 40u);
  SDMModel model;
  ASSERT_TRUE(readSDMModel(dir.write("empty.bin", bytes), model));
  EXPECT_TRUE(model.stageMatrices.empty());
  EXPECT_TRUE(model.stageBiases.empty());
  EXPECT_TRUE(model.meanShape.empty());
  EXPECT_TRUE(model.auxShape.empty());
  EXPECT_TRUE(model.stageMaps.empty());
  EXPECT_TRUE(model.stageLevels.empty());
  EXPECT_EQ(model.modelFlag, 2);
  EXPECT_EQ(model.scalesPerOctave, 5);
  EXPECT_EQ(model.faceWidth, 80);
}

TEST(SdmModelTest, TwoMoreBytesAtTheEndChangeNothing) {
  TempDir dir;
  SDMModel model;
  ASSERT_TRUE(readSDMModel(dir.write("m.bin", ModelBytes(FullModel()) + "xy"), model));
  EXPECT_EQ(model.faceWidth, 120);
  EXPECT_EQ(model.scalesPerOctave, 4);
}

TEST(SdmModelTest, EmptyMatrixRecordKeepsItsDimensions) {
  TempDir dir;
  ModelContents contents;
  contents.stageMatrices.push_back(mp::matrix(0, 5));
  SDMModel model;
  ASSERT_TRUE(readSDMModel(dir.write("m.bin", ModelBytes(contents)), model));
  ASSERT_EQ(model.stageMatrices.size(), 1u);
  EXPECT_FALSE(model.stageMatrices[0].is_valid());
  EXPECT_EQ(model.stageMatrices[0].rows(), 0);
  EXPECT_EQ(model.stageMatrices[0].columns(), 5);
  EXPECT_EQ(model.faceWidth, 100);
}

TEST(SdmModelTest, EmptyFileLoadsAndKeepsTheScalarDefaults) {
  TempDir dir;
  SDMModel model;
  ASSERT_TRUE(readSDMModel(dir.write("empty.bin", ""), model));
  EXPECT_EQ(model.scalesPerOctave, 3);
  EXPECT_EQ(model.faceWidth, 100);
  EXPECT_EQ(model.modelFlag, 1);
  EXPECT_TRUE(model.meanShape.empty());
  EXPECT_TRUE(model.stageMaps.empty());
  // The level list is resized to its count, which stays 0.
  EXPECT_TRUE(model.stageLevels.empty());
}

TEST(SdmModelTest, ShortFileLoadsWhatItHoldsAndCountsKeepTheirLastValue) {
  TempDir dir;
  // No matrices, two biases, then the file ends.
  std::ostringstream out;
  PutInt32(out, 0);
  PutInt32(out, 2);
  Sequence(1, 3, 1.0f).write(out);
  Sequence(1, 3, 4.0f).write(out);
  SDMModel model;
  ASSERT_TRUE(readSDMModel(dir.write("short.bin", out.str()), model));
  ASSERT_EQ(model.stageBiases.size(), 2u);
  EXPECT_TRUE(Same(model.stageBiases[1], Sequence(1, 3, 4.0f)));
  // The shared count variable keeps 2 through the failed reads of the float
  // lists and the maps; the level count is a variable of its own, still 0.
  EXPECT_EQ(model.meanShape, (std::vector<float>{0.0f, 0.0f}));
  EXPECT_EQ(model.auxShape.size(), 2u);
  EXPECT_EQ(model.stageMaps.size(), 2u);
  EXPECT_FALSE(model.stageMaps[0].is_valid());
  EXPECT_TRUE(model.stageLevels.empty());
  EXPECT_EQ(model.faceWidth, 100);
}

TEST(SdmModelTest, FileCutInsideAMatrixStillLoads) {
  TempDir dir;
  const std::string bytes = ModelBytes(FullModel());
  SDMModel model;
  ASSERT_TRUE(readSDMModel(dir.write("cut.bin", bytes.substr(0, bytes.size() / 2)), model));
  EXPECT_EQ(model.stageBiases.size(), 2u);
  EXPECT_EQ(model.meanShape, FullModel().meanShape);
  EXPECT_EQ(model.faceWidth, 100);
}

TEST(SdmModelTest, MissingFileIsRefusedAndLeavesTheRecordAlone) {
  SDMModel model;
  model.faceWidth = 55;
  EXPECT_FALSE(readSDMModel("/nonexistent/tavi/model.bin", model));
  EXPECT_EQ(model.faceWidth, 55);
  EXPECT_EQ(model.stageLevels.size(), 10u);
}

}  // namespace
}  // namespace SDMCore
