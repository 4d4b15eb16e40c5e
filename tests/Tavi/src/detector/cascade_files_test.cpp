#include "detector/cascade_files.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "detector/cascade_net_texts.h"
#include "nn/net.h"
#include "temp_dir.h"

namespace tavilib {
namespace {

TEST(CascadeFilesTest, ListsMeansAndOffsetsAreReadAsFarAsTheirEndsAllow) {
  TempDir dir;
  const std::vector<CascadeListEntry> entries = readCascadeList(
      dir.write("list", "# stages\nx16 0.4 trailing words\n#x32 0.8\n\nx64 0.98\nlast 0.5"));
  ASSERT_EQ(entries.size(), 3u) << "the unterminated last line is dropped";
  EXPECT_EQ(entries[0].folder, "x16");
  EXPECT_EQ(entries[0].threshold, 0.4f);
  EXPECT_EQ(entries[1].folder, "") << "an empty line is a stage, not a comment";
  EXPECT_EQ(entries[2].folder, "x64");
  EXPECT_EQ(entries[2].threshold, 0.98f);
  EXPECT_TRUE(readCascadeList(dir.path() + "/missing").empty());

  // A mean file needs white space after its last number.
  EXPECT_EQ(readMeanFile(dir.write("a", "1.5 2\n3\t4 \n")), (std::vector<float>{1.5f, 2, 3, 4}));
  EXPECT_EQ(readMeanFile(dir.write("b", "1.5 2 3")), (std::vector<float>{1.5f, 2}));
  EXPECT_EQ(readMeanFile(dir.write("c", "1 2 x 3\n")), (std::vector<float>{1, 2}));
  EXPECT_TRUE(readMeanFile(dir.path() + "/missing").empty());

  // Offsets are read until the first bad triple.
  const std::vector<OffsetScale> table =
      readOffsetsScales(dir.write("offsets", "0 0 1\n-4 4 0.9166666666666666\n5 5 1.0833"));
  ASSERT_EQ(table.size(), 3u) << "a last number at the end of the file counts";
  EXPECT_EQ(table[1].offsetX, -4);
  EXPECT_EQ(table[1].offsetY, 4);
  EXPECT_EQ(table[1].scale, 0.9166666666666666f);
  EXPECT_EQ(table[2].scale, 1.0833f);
  EXPECT_EQ(readOffsetsScales(dir.write("bad", "1 1 1\n2 x 1\n3 3 1\n")).size(), 1u);
  EXPECT_TRUE(readOffsetsScales(dir.path() + "/missing").empty());
}

std::vector<int> Shape(const nn::Blob<float>& blob) {
  return {blob.num(), blob.channels(), blob.height(), blob.width()};
}

TEST(CascadeNetTextsTest, EachDescriptionAssemblesIntoItsNet) {
  // Split layers are inserted where the data feeds two branches.
  const struct { const char *text, *name; size_t layers; std::vector<int> input, output; } nets[] = {
      {kStage0NetText, "900.175", 7, {1, 3, 384, 384}, {1, 2, 63, 63}},
      {kStage1NetText, "200.654", 15, {1, 3, 24, 24}, {1, 2, 1, 1}},
      {kStage2NetText, "100.113", 27, {1, 3, 48, 48}, {1, 2, 1, 1}},
      {kCalibrationNetText, "200.79", 7, {1, 3, 24, 24}, {1, 19, 1, 1}}};
  for (const auto& expected : nets) {
    nn::Net<float> net(expected.text, nn::NetDescription::kText);
    EXPECT_EQ(net.name(), expected.name);
    EXPECT_EQ(net.layers().size(), expected.layers) << expected.name;
    EXPECT_EQ(Shape(*net.net_input_blobs()[0]), expected.input) << expected.name;
    EXPECT_EQ(Shape(*net.output_blob()), expected.output) << expected.name;
  }
}

}  // namespace
}  // namespace tavilib
