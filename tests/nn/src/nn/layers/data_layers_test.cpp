#include "nn/data_layers.h"

#include <gtest/gtest.h>
#include <leveldb/db.h>

#include <boost/random/mersenne_twister.hpp>
#include <opencv2/core.hpp>
#include <set>
#include <string>
#include <vector>

#include "blob_proto_maker.h"
#include "gradient_checker.h"
#include "nn/engine.h"
#include "nn/net.h"
#include "nn/util/io.h"
#include "temp_dir.h"

namespace nn {
namespace {

// Sets the engine's phase for one test and puts the old one back.
struct PhaseScope {
  explicit PhaseScope(Engine::Phase phase) { Engine::set_phase(phase); }
  ~PhaseScope() { Engine::set_phase(old); }
  Engine::Phase old = Engine::phase();
};

// A record whose bytes count up from `first`.
Datum ByteDatum(int channels, int height, int width, int first, int label = 0) {
  Datum datum = Parse<Datum>("label: " + std::to_string(label));
  datum.set_channels(channels);
  datum.set_height(height);
  datum.set_width(width);
  for (int i = 0; i < channels * height * width; ++i) {
    datum.mutable_data()->push_back(static_cast<char>(first + i));
  }
  return datum;
}

// The source setting of a new database in dir holding the records in order.
std::string Source(const TempDir& dir, const std::string& name, const std::vector<Datum>& records) {
  leveldb::Options options;
  options.create_if_missing = true;
  leveldb::DB* db = nullptr;
  EXPECT_TRUE(leveldb::DB::Open(options, dir.path() + "/" + name, &db).ok());
  for (size_t i = 0; i < records.size(); ++i) {
    db->Put(leveldb::WriteOptions(), std::to_string(100000 + i), records[i].SerializeAsString());
  }
  delete db;
  return " source: '" + dir.path() + "/" + name + "' ";
}

std::string Mean(const TempDir& dir, int channels, int height, int width,
                 const std::vector<float>& values) {
  EXPECT_TRUE(WriteProtoToBinaryFile(MakeBlob(1, channels, height, width, values),
                                     dir.path() + "/mean"));
  return " mean_file: '" + dir.path() + "/mean' ";
}

TEST(DataLayerTest, FeedsANetFromTheDrawnRecordAcrossTheEndOfTheDatabase) {
  TempDir dir;
  const std::string common = "batch_size: 2 scale: 0.5" + Mean(dir, 2, 1, 2, {1, 2, 3, 4});
  Engine::rng_engine().seed(1u);
  boost::mt19937 copy = Engine::rng_engine();
  const int skip = static_cast<int>(copy() % 10);
  ASSERT_TRUE(skip >= 3 && skip % 3 != 0) << "this seed must wrap in SetUp and move the start";
  const std::string bytes =
      Source(dir, "bytes", {ByteDatum(2, 1, 2, 10, 0), ByteDatum(2, 1, 2, 20, 1),
                            ByteDatum(2, 1, 2, 30, 2)});
  const std::string floats =
      Source(dir, "floats", {Parse<Datum>("channels: 2 height: 1 width: 2 "
                                          "float_data: [-1.5, 0.25, 300, 4]")});
  Net<float> net("layers { name: 'b' type: DATA top: 'bytes' top: 'labels' data_param { " + common +
                     bytes + "rand_skip: 10 } } layers { name: 'f' type: DATA top: 'floats' "
                     "data_param { " + common + floats + "} }",
                 NetDescription::kText);
  // The outputs come in the order of their names.
  const Blob<float>& data = *net.output_blobs()[0];
  const Blob<float>& labels = *net.output_blobs()[2];
  EXPECT_EQ(Shape(data), std::vector<int>({2, 2, 1, 2}));
  for (int batch = 0; batch < 3; ++batch) {
    net.Forward();
    for (int item = 0; item < 2; ++item) {
      // Record r holds bytes 10 (r + 1) + j; the mean is j + 1.
      const int record = (skip + 2 * batch + item) % 3;
      EXPECT_EQ(std::vector<float>(data.cpu_data() + item * 4, data.cpu_data() + item * 4 + 4),
                std::vector<float>(4, (10 * (record + 1) - 1) * 0.5f)) << record;
      EXPECT_EQ(labels.cpu_data()[item], record);
    }
  }
  EXPECT_EQ(Values(*net.output_blobs()[1]),
            std::vector<float>({-1.25f, -0.875f, 148.5f, 0, -1.25f, -0.875f, 148.5f, 0}));
}

// A worker still reading when its layer goes must be joined before the
// database is released, or the thread object ends the process.
TEST(DataLayerTest, DestructionJoinsTheWorkerBeforeReleasingTheDatabase) {
  TempDir dir;
  Blob<float> data;
  Blobs top = {&data};
  DataLayer<float> layer(Parse<LayerParameter>(
      "data_param { batch_size: 64" +
      Source(dir, "db", std::vector<Datum>(8, ByteDatum(3, 16, 16, 0))) + "}"));
  layer.SetUp({}, &top);
}

TEST(DataLayerTest, CropsAreCentredOutsideTrainingAndDrawnInTraining) {
  TempDir dir;
  const std::string param =
      "data_param { batch_size: 4 crop_size: 3" + Source(dir, "db", {ByteDatum(1, 5, 6, 0)});
  std::vector<float> halves(30);
  for (int i = 0; i < 30; ++i) {
    halves[i] = i / 2.0f;
  }
  Blob<float> data;
  Blobs top = {&data};
  {
    PhaseScope phase(Engine::TEST);
    DataLayer<float> layer(Parse<LayerParameter>(param + Mean(dir, 1, 5, 6, halves) + "}"));
    layer.SetUp({}, &top);
    layer.Forward({}, &top);
    // Rows and columns 1 to 3 of the plane of bytes 0..29, less half their index.
    EXPECT_EQ(std::vector<float>(data.cpu_data(), data.cpu_data() + 9),
              std::vector<float>({3.5f, 4, 4.5f, 6.5f, 7, 7.5f, 9.5f, 10, 10.5f}));
  }
  PhaseScope phase(Engine::TRAIN);
  DataLayer<float> layer(Parse<LayerParameter>(param + "mirror: true }"));
  layer.SetUp({}, &top);
  std::set<std::vector<float>> seen;
  for (int pass = 0; pass < 50; ++pass) {
    layer.Forward({}, &top);
    for (int item = 0; item < 4; ++item) {
      seen.insert(std::vector<float>(data.cpu_data() + item * 9, data.cpu_data() + item * 9 + 4));
    }
  }
  // Rows 0 and 1 and columns 0 to 2 (below 5 - 3 and 6 - 3: the last offset
  // is never drawn), each crop plain or mirrored.
  EXPECT_EQ(seen.size(), 12u);
  EXPECT_EQ(seen.count({10, 9, 8, 16}), 1u) << "the last crop, mirrored";
}

TEST(DataLayerDeathTest, SetUpAndWorkerRefuseBadSettings) {
  TempDir dir;
  const std::string bytes = Source(dir, "bytes", {ByteDatum(1, 2, 3, 0)});
  const std::string floats = Source(
      dir, "floats", {Parse<Datum>("channels: 1 height: 2 width: 2 float_data: [0, 0, 0, 0]")});
  Blob<float> data;
  const auto run = [&data](const std::string& settings, int tops) {
    Blobs top(tops, &data);
    DataLayer<float> layer(Parse<LayerParameter>("data_param { batch_size: 1 " + settings + "}"));
    layer.SetUp({}, &top);
    layer.Forward({}, &top);
  };
  EXPECT_DEATH(run(bytes, 3), "Data Layer takes at most two blobs as output.");
  EXPECT_DEATH(run("source: '" + dir.path() + "/none'", 2),
               "Check failed: status.ok\\(\\) Failed to open leveldb .*/none");
  EXPECT_DEATH(run(Source(dir, "empty", {}), 2), "holds no record.");
  EXPECT_DEATH(run(bytes + "crop_size: 2", 2), "Check failed: datum_height_ > crop_size ");
  EXPECT_DEATH(run(bytes + "mirror: true", 2),
               "Current implementation requires mirror and crop_size to be set at the same time.");
  EXPECT_DEATH(run(bytes + Mean(dir, 2, 2, 3, {}), 2),
               "Check failed: data_mean_.channels\\(\\) == datum_channels_ ");
  EXPECT_DEATH(run("crop_size: 1" + floats, 2),
               "Check failed: data.size\\(\\) Image cropping only support uint8 data");
  PhaseScope phase(Engine::TEST);
  EXPECT_DEATH(run(bytes + "crop_size: 1 mirror: true", 2), "Check failed: prefetch_rng_ ");
}

TEST(InMemoryDataLayersDeathTest, ImagesAreServedInTurnAndBadSettingsOrNoArrayAreFatal) {
  // Images 4 x 5 whose bytes count up from 0, 50 and 100, row by row.
  std::vector<boost::shared_ptr<cv::Mat>> images;
  for (int first : {0, 50, 100}) {
    images.emplace_back(new cv::Mat(4, 5, CV_8UC3));
    for (int i = 0; i < 60; ++i) {
      images.back()->data[i] = static_cast<unsigned char>(first + i);
    }
  }
  Blob<float> data;
  Blob<float> labels;
  Blobs top = {&data, &labels};
  // Sets a layer up on the first `count` images and runs one batch.
  const auto run = [&](const std::string& settings, int count) {
    ImageDataLayer<float> layer(Parse<LayerParameter>("image_data_param { " + settings + " }"));
    layer.set_active_images({images.begin(), images.begin() + count});
    layer.SetUp({}, &top);
    layer.Forward({}, &top);
  };
  // Planes come last channel first, and new_height becomes the width.
  Datum datum = ByteDatum(1, 1, 1, 9, 7);
  EXPECT_TRUE(ReadImageToDatum(cv::Mat(5, 5, CV_8UC3, cv::Scalar(10, 20, 30)), 4, 2, &datum));
  EXPECT_EQ(std::vector<int>({datum.channels(), datum.height(), datum.width(), datum.label()}),
            std::vector<int>({3, 2, 4, 0}));
  EXPECT_EQ(datum.data(), std::string(8, 30) + std::string(8, 20) + std::string(8, 10));
  EXPECT_DEATH(ReadImageToDatum(cv::Mat(2, 2, CV_8UC1), 0, 0, &datum),
               "ReadImageToDatum takes 8-bit images of three channels");

  // SetUp shapes a square of new_height; the worker's records are 2 wide and
  // 3 high, of which the first 12 bytes are used.
  run("batch_size: 4 new_height: 2 new_width: 3", 3);
  EXPECT_EQ(Shape(data), std::vector<int>({4, 3, 2, 2}));
  EXPECT_EQ(Values(labels), std::vector<float>(4, 0.0f));
  for (int item = 0; item < 4; ++item) {
    ReadImageToDatum(*images[item % 3], 2, 3, &datum);
    const auto* bytes = reinterpret_cast<const unsigned char*>(datum.data().data());
    EXPECT_EQ(std::vector<float>(data.cpu_data() + item * 12, data.cpu_data() + (item + 1) * 12),
              std::vector<float>(bytes, bytes + 12)) << item;
  }

  PhaseScope phase(Engine::TEST);
  // Outside training only shuffle gives the worker a generator for the flips.
  run("batch_size: 1 crop_size: 2 mirror: true shuffle: true", 1);
  EXPECT_DEATH(run("batch_size: 1 crop_size: 2 mirror: true", 1), "");
  // A new_height of -1, as SetUp reads it.
  EXPECT_DEATH(run("batch_size: 1 new_height: 4294967295 new_width: 2", 1),
               "Current implementation requires new_height and new_width to be set at the same");
  // With no image and no size, the blank image is empty.
  EXPECT_DEATH(run("batch_size: 1", 0), "Check failed: datum_height_ > crop_size \\(0 vs. 0\\)");
  // This seed draws a skip past the one image.
  EXPECT_DEATH((Engine::rng_engine().seed(3u), run("batch_size: 1 rand_skip: 1000", 1)),
               "Check failed: activeImagePtrs_.size\\(\\) > skip .*Not enough points to skip");

  MemoryDataLayer<float> memory(
      Parse<LayerParameter>("memory_data_param { batch_size: 2 channels: 3 height: 4 width: 5 }"));
  memory.SetUp({}, &top);
  EXPECT_EQ(Shape(data), std::vector<int>({2, 3, 4, 5}));
  EXPECT_EQ(Shape(labels), std::vector<int>({2, 1, 1, 1}));
  EXPECT_DEATH(memory.Forward({}, &top),
               "Check failed: data_ MemoryDataLayer needs to be initalized by calling Reset");
}

}  // namespace
}  // namespace nn
