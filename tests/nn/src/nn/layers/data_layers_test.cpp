#include "nn/data_layers.h"

#include <gtest/gtest.h>
#include <leveldb/db.h>

#include <boost/random/mersenne_twister.hpp>
#include <opencv2/core.hpp>

#include <cstdio>
#include <memory>
#include <set>
#include <string>
#include <tuple>
#include <vector>

#include "blob_proto_maker.h"
#include "nn/engine.h"
#include "nn/net.h"
#include "nn/util/io.h"
#include "temp_dir.h"

namespace nn {
namespace {

using Blobs = std::vector<Blob<float>*>;

// Sets the engine's phase for one test and puts the old one back.
class PhaseScope {
 public:
  explicit PhaseScope(Engine::Phase phase) : old_(Engine::phase()) { Engine::set_phase(phase); }
  ~PhaseScope() { Engine::set_phase(old_); }

 private:
  Engine::Phase old_;
};

// A record whose bytes count up from `first`.
Datum ByteDatum(int channels, int height, int width, int first, int label) {
  Datum datum;
  datum.set_channels(channels);
  datum.set_height(height);
  datum.set_width(width);
  datum.set_label(label);
  for (int i = 0; i < channels * height * width; ++i) {
    datum.mutable_data()->push_back(static_cast<char>(first + i));
  }
  return datum;
}

// A new database holding the records in the given order.
std::string WriteDatabase(const TempDir& dir, const std::vector<Datum>& records) {
  const std::string path = dir.path() + "/db";
  leveldb::Options options;
  options.create_if_missing = true;
  options.error_if_exists = true;
  leveldb::DB* db = nullptr;
  EXPECT_TRUE(leveldb::DB::Open(options, path, &db).ok());
  for (size_t i = 0; i < records.size(); ++i) {
    char key[32];
    std::snprintf(key, sizeof(key), "%08zu", i);
    EXPECT_TRUE(db->Put(leveldb::WriteOptions(), key, records[i].SerializeAsString()).ok());
  }
  delete db;
  return path;
}

LayerParameter DataParam(const std::string& source, int batch_size) {
  LayerParameter param;
  param.set_type(LayerParameter::DATA);
  param.mutable_data_param()->set_source(source);
  param.mutable_data_param()->set_batch_size(batch_size);
  return param;
}

LayerParameter ImageParam(int batch_size, int new_height, int new_width) {
  LayerParameter param;
  param.set_type(LayerParameter::IMAGE_DATA);
  param.mutable_image_data_param()->set_batch_size(batch_size);
  param.mutable_image_data_param()->set_new_height(new_height);
  param.mutable_image_data_param()->set_new_width(new_width);
  return param;
}

// A 3-channel image whose bytes count up from `first`, row by row.
boost::shared_ptr<cv::Mat> CountingImage(int rows, int cols, int first) {
  boost::shared_ptr<cv::Mat> image(new cv::Mat(rows, cols, CV_8UC3));
  for (int i = 0; i < rows * cols * 3; ++i) {
    image->data[i] = static_cast<unsigned char>(first + i);
  }
  return image;
}

std::vector<float> Values(const Blob<float>& blob, int from, int count) {
  return std::vector<float>(blob.cpu_data() + from, blob.cpu_data() + from + count);
}

std::vector<float> DatumBytes(const Datum& datum, int count) {
  std::vector<float> values;
  for (int i = 0; i < count; ++i) {
    values.push_back(static_cast<unsigned char>(datum.data()[i]));
  }
  return values;
}

TEST(ReadImageToDatumTest, PlanesComeLastChannelFirstAndResizeSwapsTheSizes) {
  const boost::shared_ptr<cv::Mat> image = CountingImage(2, 3, 0);
  Datum datum = ByteDatum(1, 1, 1, 9, 7);
  EXPECT_TRUE(ReadImageToDatum(*image, 0, 0, &datum));
  EXPECT_EQ(datum.channels(), 3);
  EXPECT_EQ(datum.height(), 2);
  EXPECT_EQ(datum.width(), 3);
  EXPECT_EQ(datum.label(), 0);
  ASSERT_EQ(datum.data().size(), 18u);
  // Pixel (h, w) holds bytes 3 * (3h + w) + channel.
  for (int c = 0; c < 3; ++c) {
    for (int p = 0; p < 6; ++p) {
      EXPECT_EQ(static_cast<unsigned char>(datum.data()[c * 6 + p]), 3 * p + (2 - c));
    }
  }

  // new_height becomes the width; with one size 0 nothing is resized.
  cv::Mat flat(5, 5, CV_8UC3, cv::Scalar(10, 20, 30));
  ReadImageToDatum(flat, 4, 2, &datum);
  EXPECT_EQ(datum.height(), 2);
  EXPECT_EQ(datum.width(), 4);
  EXPECT_EQ(DatumBytes(datum, 24), std::vector<float>({30, 30, 30, 30, 30, 30, 30, 30, 20, 20, 20, 20,
                                                       20, 20, 20, 20, 10, 10, 10, 10, 10, 10, 10, 10}));
  ReadImageToDatum(flat, 4, 0, &datum);
  EXPECT_EQ(datum.height(), 5);
  EXPECT_EQ(datum.width(), 5);

  cv::Mat grey(2, 2, CV_8UC1);
  EXPECT_DEATH(ReadImageToDatum(grey, 0, 0, &datum),
               "ReadImageToDatum takes 8-bit images of three channels");
}

TEST(DataLayerTest, FeedsANetAcrossTheEndOfTheDatabase) {
  TempDir dir;
  const std::string source =
      WriteDatabase(dir, {ByteDatum(2, 1, 2, 10, 0), ByteDatum(2, 1, 2, 20, 1),
                          ByteDatum(2, 1, 2, 30, 2)});
  const std::string mean = dir.path() + "/mean";
  ASSERT_TRUE(WriteProtoToBinaryFile(MakeBlob(1, 2, 1, 2, {1, 2, 3, 4}), mean));
  Net<float> net("layers { name: \"d\" type: DATA top: \"data\" top: \"label\" data_param { "
                 "batch_size: 2 scale: 0.5 source: \"" + source + "\" mean_file: \"" + mean +
                     "\" } }",
                 NetDescription::kText);
  const Blob<float>& data = *net.output_blobs()[0];
  const Blob<float>& labels = *net.output_blobs()[1];
  EXPECT_EQ(std::vector<int>({data.num(), data.channels(), data.height(), data.width()}),
            std::vector<int>({2, 2, 1, 2}));
  EXPECT_EQ(labels.count(), 2);
  for (const std::vector<int>& batch : {std::vector<int>{0, 1}, {2, 0}, {1, 2}}) {
    net.Forward();
    for (int item = 0; item < 2; ++item) {
      // Record r holds bytes 10 (r + 1) + j; the mean is j + 1.
      for (int j = 0; j < 4; ++j) {
        EXPECT_EQ(data.cpu_data()[item * 4 + j], (10 * (batch[item] + 1) - 1) * 0.5f)
            << "record " << batch[item] << " element " << j;
      }
      EXPECT_EQ(labels.cpu_data()[item], batch[item]);
    }
  }
}

TEST(DataLayerTest, RecordsOfFloatsWithoutLabels) {
  TempDir dir;
  Datum record;
  record.set_channels(1);
  record.set_height(1);
  record.set_width(3);
  for (float v : {-1.5f, 0.25f, 300.0f}) {
    record.add_float_data(v);
  }
  Blob<float> data;
  Blobs top = {&data};
  DataLayer<float> layer(DataParam(WriteDatabase(dir, {record}), 2));
  layer.SetUp({}, &top);
  layer.Forward({}, &top);
  EXPECT_EQ(Values(data, 0, 6), std::vector<float>({-1.5f, 0.25f, 300, -1.5f, 0.25f, 300}));
}

TEST(DataLayerTest, RandSkipStartsAtTheDrawnRecord) {
  TempDir dir;
  std::vector<Datum> records;
  for (int i = 0; i < 4; ++i) {
    records.push_back(ByteDatum(1, 1, 1, i, i));
  }
  LayerParameter param = DataParam(WriteDatabase(dir, records), 3);
  param.mutable_data_param()->set_rand_skip(10);
  Engine::rng_engine().seed(5u);
  boost::mt19937 copy = Engine::rng_engine();
  const int skip = static_cast<int>(copy() % 10);
  Blob<float> data;
  Blob<float> labels;
  Blobs top = {&data, &labels};
  DataLayer<float> layer(param);
  layer.SetUp({}, &top);
  layer.Forward({}, &top);
  for (int item = 0; item < 3; ++item) {
    EXPECT_EQ(labels.cpu_data()[item], (skip + item) % 4) << "skip " << skip;
  }
}

// A layer's worker must be joined before its database goes, or the thread
// object ends the process.
TEST(DataLayerTest, DestructionJoinsTheWorker) {
  TempDir dir;
  std::vector<Datum> records;
  for (int i = 0; i < 8; ++i) {
    records.push_back(ByteDatum(3, 16, 16, i, i));
  }
  const std::string source = WriteDatabase(dir, records);
  for (int forwards = 0; forwards < 3; ++forwards) {
    Blob<float> data;
    Blob<float> labels;
    Blobs top = {&data, &labels};
    DataLayer<float> layer(DataParam(source, 64));
    layer.SetUp({}, &top);
    for (int i = 0; i < forwards; ++i) {
      layer.Forward({}, &top);
    }
  }
  Blob<float> data;
  Blob<float> labels;
  Blobs top = {&data, &labels};
  ImageDataLayer<float> images(ImageParam(64, 16, 16));
  images.SetUp({}, &top);
}

// Decodes which crop of a 5x6 plane of bytes 0..29 an item holds.
std::tuple<int, int, bool> CropOf(const float* item, int crop) {
  const bool flipped = item[1] < item[0];
  const int corner = static_cast<int>(flipped ? item[crop - 1] : item[0]);
  for (int h = 0; h < crop; ++h) {
    for (int w = 0; w < crop; ++w) {
      const int column = flipped ? crop - 1 - w : w;
      EXPECT_EQ(item[h * crop + column], corner + h * 6 + w);
    }
  }
  return {corner / 6, corner % 6, flipped};
}

TEST(DataLayerTest, CropsAreCentredOutsideTrainingAndDrawnInTraining) {
  TempDir dir;
  LayerParameter param = DataParam(WriteDatabase(dir, {ByteDatum(1, 5, 6, 0, 0)}), 4);
  param.mutable_data_param()->set_crop_size(3);
  Blob<float> data;
  Blob<float> labels;
  Blobs top = {&data, &labels};
  {
    PhaseScope phase(Engine::TEST);
    DataLayer<float> layer(param);
    layer.SetUp({}, &top);
    EXPECT_EQ(data.height(), 3);
    EXPECT_EQ(data.width(), 3);
    layer.Forward({}, &top);
    EXPECT_EQ(CropOf(data.cpu_data(), 3), std::make_tuple(1, 1, false));
  }

  PhaseScope phase(Engine::TRAIN);
  param.mutable_data_param()->set_mirror(true);
  DataLayer<float> layer(param);
  layer.SetUp({}, &top);
  std::set<std::tuple<int, int, bool>> seen;
  for (int pass = 0; pass < 50; ++pass) {
    layer.Forward({}, &top);
    for (int item = 0; item < 4; ++item) {
      seen.insert(CropOf(data.cpu_data() + item * 9, 3));
    }
  }
  // Offsets below 5 - 3 and 6 - 3: the last one is never drawn.
  std::set<std::tuple<int, int, bool>> expected;
  for (int h = 0; h < 2; ++h) {
    for (int w = 0; w < 3; ++w) {
      expected.insert({h, w, false});
      expected.insert({h, w, true});
    }
  }
  EXPECT_EQ(seen, expected);
}

TEST(DataLayerDeathTest, SetUpAndWorkerRefuseBadSettings) {
  TempDir dir;
  const std::string source = WriteDatabase(dir, {ByteDatum(1, 2, 3, 0, 0)});
  Blob<float> data;
  Blob<float> labels;
  Blobs one = {&data};
  Blobs two = {&data, &labels};
  Blobs three = {&data, &labels, &labels};
  const auto run = [](const LayerParameter& param, Blobs bottom, Blobs top) {
    DataLayer<float> layer(param);
    layer.SetUp(bottom, &top);
    layer.Forward(bottom, &top);
  };
  const LayerParameter plain = DataParam(source, 1);
  EXPECT_DEATH(run(plain, one, one),
               "Check failed: bottom.size\\(\\) == 0 .*Data Layer takes no input blobs.");
  EXPECT_DEATH(run(plain, {}, {}),
               "Check failed: top->size\\(\\) >= 1 .*Data Layer takes at least one blob as output.");
  EXPECT_DEATH(run(plain, {}, three),
               "Check failed: top->size\\(\\) <= 2 .*Data Layer takes at most two blobs as output.");
  EXPECT_DEATH(run(DataParam(dir.path() + "/none", 1), {}, two),
               "Check failed: status.ok\\(\\) Failed to open leveldb .*/none");
  EXPECT_DEATH(run(DataParam(source, 0), {}, two), "A data layer needs a batch_size above 0.");

  LayerParameter param = plain;
  param.mutable_data_param()->set_crop_size(2);
  EXPECT_DEATH(run(param, {}, two), "Check failed: datum_height_ > crop_size \\(2 vs. 2\\)");
  param.mutable_data_param()->set_crop_size(0);
  param.mutable_data_param()->set_mirror(true);
  EXPECT_DEATH(run(param, {}, two),
               "Current implementation requires mirror and crop_size to be set at the same time.");
  param.mutable_data_param()->set_crop_size(1);
  {
    PhaseScope phase(Engine::TEST);
    EXPECT_DEATH(run(param, {}, two), "Check failed: prefetch_rng_ ");
  }

  ASSERT_TRUE(WriteProtoToBinaryFile(MakeBlob(1, 2, 2, 3, {}), dir.path() + "/mean"));
  param = plain;
  param.mutable_data_param()->set_mean_file(dir.path() + "/mean");
  EXPECT_DEATH(run(param, {}, two),
               "Check failed: data_mean_.channels\\(\\) == datum_channels_ \\(2 vs. 1\\)");

  TempDir other;
  Datum floats;
  floats.set_channels(1);
  floats.set_height(2);
  floats.set_width(2);
  floats.mutable_float_data()->Resize(4, 0.0f);
  param = DataParam(WriteDatabase(other, {floats}), 1);
  param.mutable_data_param()->set_crop_size(1);
  EXPECT_DEATH(run(param, {}, two),
               "Check failed: data.size\\(\\) Image cropping only support uint8 data");
  TempDir empty;
  EXPECT_DEATH(run(DataParam(WriteDatabase(empty, {}), 1), {}, two), "holds no record.");
}

TEST(ImageDataLayerTest, ServesTheImagesInTurnAsRecords) {
  std::vector<boost::shared_ptr<cv::Mat>> images = {CountingImage(3, 2, 0), CountingImage(3, 2, 50),
                                                    CountingImage(3, 2, 100)};
  Blob<float> data;
  Blob<float> labels;
  Blobs top = {&data, &labels};
  ImageDataLayer<float> layer(ImageParam(2, 0, 0));
  layer.set_active_images(images);
  layer.SetUp({}, &top);
  EXPECT_EQ(data.num(), 2);
  EXPECT_EQ(data.channels(), 3);
  EXPECT_EQ(data.height(), 3);
  EXPECT_EQ(data.width(), 2);
  for (const std::vector<int>& batch : {std::vector<int>{0, 1}, {2, 0}}) {
    layer.Forward({}, &top);
    for (int item = 0; item < 2; ++item) {
      Datum datum;
      ReadImageToDatum(*images[batch[item]], 0, 0, &datum);
      EXPECT_EQ(Values(data, item * 18, 18), DatumBytes(datum, 18)) << "image " << batch[item];
      EXPECT_EQ(labels.cpu_data()[item], 0.0f);
    }
  }
}

TEST(ImageDataLayerTest, UnequalNewSizesShapeASquareOfNewHeight) {
  const boost::shared_ptr<cv::Mat> image = CountingImage(4, 4, 0);
  Blob<float> data;
  Blob<float> labels;
  Blobs top = {&data, &labels};
  ImageDataLayer<float> layer(ImageParam(1, 2, 3));
  layer.set_active_images({image});
  layer.SetUp({}, &top);
  EXPECT_EQ(data.height(), 2);
  EXPECT_EQ(data.width(), 2);
  layer.Forward({}, &top);
  // The worker's record is 2 wide and 3 high; its first 12 bytes are used.
  Datum datum;
  ReadImageToDatum(*image, 2, 3, &datum);
  ASSERT_EQ(datum.data().size(), 18u);
  EXPECT_EQ(Values(data, 0, 12), DatumBytes(datum, 12));
}

TEST(ImageDataLayerTest, ShuffleMirrorsOutsideTrainingAroundACentredCrop) {
  PhaseScope phase(Engine::TEST);
  LayerParameter param = ImageParam(8, 0, 0);
  param.mutable_image_data_param()->set_crop_size(2);
  param.mutable_image_data_param()->set_mirror(true);
  param.mutable_image_data_param()->set_shuffle(true);
  Blob<float> data;
  Blob<float> labels;
  Blobs top = {&data, &labels};
  ImageDataLayer<float> layer(param);
  // Offsets (4 - 2) / 2 and (5 - 2) / 2: the crop starts at pixel (1, 1).
  layer.set_active_images({CountingImage(4, 5, 0)});
  layer.SetUp({}, &top);
  std::set<float> first_values;
  for (int pass = 0; pass < 8; ++pass) {
    layer.Forward({}, &top);
    for (int item = 0; item < 8; ++item) {
      // Red plane, row 0: bytes 3 * 6 + 2 and 3 * 7 + 2, in either order.
      const std::vector<float> row = Values(data, item * 12, 2);
      EXPECT_TRUE(row == std::vector<float>({20, 23}) || row == std::vector<float>({23, 20}));
      first_values.insert(row[0]);
    }
  }
  EXPECT_EQ(first_values.size(), 2u) << "both mirrored and plain crops";
}

TEST(ImageDataLayerTest, WithoutImagesANetWorksOnOneBlankImage) {
  Net<float> net(R"(
    layers { name: "images" type: IMAGE_DATA top: "data" top: "label"
             image_data_param { batch_size: 2 new_height: 3 } }
  )", NetDescription::kText);
  ASSERT_EQ(net.output_blobs().size(), 2u);
  const Blob<float>& data = *net.output_blobs()[0];
  EXPECT_EQ(std::vector<int>({data.num(), data.channels(), data.height(), data.width()}),
            std::vector<int>({2, 3, 3, 3}));
  net.Forward();
  EXPECT_EQ(Values(*net.output_blobs()[1], 0, 2), std::vector<float>({0, 0}));
}

TEST(ImageDataLayerDeathTest, SetUpAndWorkerRefuseBadSettings) {
  Blob<float> data;
  Blob<float> labels;
  Blobs two = {&data, &labels};
  const auto run = [](const LayerParameter& param, Blobs bottom, Blobs top) {
    ImageDataLayer<float> layer(param);
    layer.set_active_images({CountingImage(3, 3, 0)});
    layer.SetUp(bottom, &top);
    layer.Forward(bottom, &top);
  };
  EXPECT_DEATH(run(ImageParam(1, 0, 0), two, two),
               "Check failed: bottom.size\\(\\) == 0 .*Input Layer takes no input blobs.");
  EXPECT_DEATH(run(ImageParam(1, 0, 0), {}, {&data}),
               "Check failed: top->size\\(\\) == 2 .*Input Layer takes two blobs as output.");
  EXPECT_DEATH(run(ImageParam(1, -1, 2), {}, two),
               "Current implementation requires new_height and new_width to be set at the same "
               "time.");
  // With no image and no size, the blank image is empty.
  EXPECT_DEATH(
      {
        ImageDataLayer<float> layer(ImageParam(1, 0, 0));
        layer.SetUp({}, &two);
      },
      "Check failed: datum_height_ > crop_size \\(0 vs. 0\\)");

  LayerParameter param = ImageParam(1, 0, 0);
  param.mutable_image_data_param()->set_rand_skip(1000);
  Engine::rng_engine().seed(3u);
  boost::mt19937 copy = Engine::rng_engine();
  ASSERT_GE(copy() % 1000, 1u) << "this seed must skip past the one image";
  EXPECT_DEATH(
      {
        Engine::rng_engine().seed(3u);
        run(param, {}, two);
      },
      "Check failed: activeImagePtrs_.size\\(\\) > skip .*Not enough points to skip");

  // Mirroring outside training without shuffle has no generator to draw from.
  PhaseScope phase(Engine::TEST);
  param = ImageParam(1, 0, 0);
  param.mutable_image_data_param()->set_crop_size(2);
  param.mutable_image_data_param()->set_mirror(true);
  EXPECT_DEATH(run(param, {}, two), "");
}

TEST(MemoryDataLayerTest, ShapesItsTopsAndHasNothingToServe) {
  LayerParameter param;
  MemoryDataParameter* memory = param.mutable_memory_data_param();
  memory->set_batch_size(2);
  memory->set_channels(3);
  memory->set_height(4);
  memory->set_width(5);
  Blob<float> data;
  Blob<float> labels;
  Blobs top = {&data, &labels};
  MemoryDataLayer<float> layer(param);
  layer.SetUp({}, &top);
  EXPECT_EQ(std::vector<int>({data.num(), data.channels(), data.height(), data.width()}),
            std::vector<int>({2, 3, 4, 5}));
  EXPECT_EQ(std::vector<int>({labels.num(), labels.channels(), labels.height(), labels.width()}),
            std::vector<int>({2, 1, 1, 1}));
  EXPECT_DEATH(layer.Forward({}, &top),
               "Check failed: data_ MemoryDataLayer needs to be initalized by calling Reset");

  EXPECT_DEATH(MemoryDataLayer<float>(param).SetUp(top, &top),
               "Check failed: bottom.size\\(\\) == 0 .*Memory Data Layer takes no blobs as input.");
  Blobs one = {&data};
  EXPECT_DEATH(MemoryDataLayer<float>(param).SetUp({}, &one),
               "Check failed: top->size\\(\\) == 2 .*Memory Data Layer takes two blobs as output.");
  memory->clear_height();
  EXPECT_DEATH(MemoryDataLayer<float>(param).SetUp({}, &top),
               "Check failed: batch_size_ \\* datum_size_ > 0 .*batch_size, channels, height, and "
               "width must be specified and positive in memory_data_param");
}

}  // namespace
}  // namespace nn
