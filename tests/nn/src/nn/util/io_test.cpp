#include "nn/util/io.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <string>

#include "temp_dir.h"

namespace nn {
namespace {

const char kDescription[] =
    "name: \"tiny\"\t\t\t\n"
    "input: \"data\"\n"
    "input_dim: 1 input_dim: 3 input_dim: 12 input_dim: 12\n"
    "# a comment line\n"
    "layers { name: \"conv1\" type: CONVOLUTION bottom: \"data\" top: \"conv1\"\n"
    "  convolution_param { num_output: 16 kernel_size: 3 } }\n"
    "layers { name: \"probs\" type: SOFTMAX bottom: \"conv1\" top: \"probs\" }";  // no newline

// A binary NetParameter whose name field declares name_length bytes, written
// as a sparse file so that huge messages cost no disk.
std::string WriteHugeNameMessage(const TempDir& dir, uint64_t name_length) {
  std::string header = "\x0a";
  for (uint64_t v = name_length; ; v >>= 7) {
    if (v < 0x80) {
      header += static_cast<char>(v);
      break;
    }
    header += static_cast<char>((v & 0x7f) | 0x80);
  }
  const std::string path = dir.write("huge.binaryproto", header);
  EXPECT_EQ(truncate(path.c_str(), static_cast<off_t>(header.size() + name_length)), 0);
  return path;
}

TEST(IoTest, TextFileAndTextInMemoryGiveTheSameDescription) {
  TempDir dir;
  const std::string path = dir.write("net.prototxt", kDescription);

  NetParameter from_file;
  ReadNetParamsFromTextFile(path, &from_file);
  NetParameter from_text;
  ReadNetParamsFromText(kDescription, &from_text);

  EXPECT_EQ(from_file.SerializeAsString(), from_text.SerializeAsString());
  EXPECT_EQ(from_file.name(), "tiny");
  ASSERT_EQ(from_file.input_dim_size(), 4);
  EXPECT_EQ(from_file.input_dim(2), 12);
  ASSERT_EQ(from_file.layers_size(), 2) << "the last line, without a newline, is read too";
  EXPECT_EQ(from_file.layers(0).convolution_param().num_output(), 16u);
  EXPECT_EQ(from_file.layers(1).top(0), "probs");
}

TEST(IoTest, EmptyTextFileIsAnEmptyDescription) {
  TempDir dir;
  NetParameter param;
  ReadNetParamsFromTextFile(dir.write("empty.prototxt", ""), &param);
  EXPECT_EQ(param.layers_size(), 0);
  EXPECT_FALSE(param.has_name());
}

TEST(IoTest, BinaryWeightFileRoundTrips) {
  NetParameter weights;
  LayerParameter* layer = weights.add_layers();
  layer->set_name("fc");
  BlobProto* blob = layer->add_blobs();
  blob->set_num(1);
  blob->set_channels(1);
  blob->set_height(2);
  blob->set_width(2);
  for (int i = 0; i < 4; ++i) {
    blob->add_data(i * 0.5f);
  }
  TempDir dir;
  const std::string path = dir.write("weights", weights.SerializeAsString());

  NetParameter read;
  ReadNetParamsFromBinaryFile(path, &read);
  EXPECT_EQ(read.SerializeAsString(), weights.SerializeAsString());
}

TEST(IoTest, BinaryReaderTakesMessagesAboveTheOldDefaultLimit) {
  TempDir dir;
  NetParameter param;
  EXPECT_TRUE(ReadProtoFromBinaryFile(WriteHugeNameMessage(dir, 70u << 20).c_str(), &param));
  EXPECT_EQ(param.name().size(), 70u << 20);
}

TEST(IoDeathTest, UnreadableFilesEndTheProcessWithTheirWords) {
  // Death tests re-run the test body in a child, which makes its own folder:
  // the expected words leave the folder's name out.
  TempDir dir;
  const std::string missing = dir.path() + "/missing";
  NetParameter param;
  EXPECT_DEATH(ReadNetParamsFromTextFile(missing, &param),
               "Check failed: fd != -1 .*File not found: .*/missing");
  EXPECT_DEATH(ReadNetParamsFromBinaryFile(missing, &param),
               "Check failed: fd != -1 .*File not found: .*/missing");

  const std::string garbled = dir.write("garbled", "layers { name: \"a\" type: NO_SUCH_TYPE }\n");
  EXPECT_DEATH(ReadNetParamsFromTextFile(garbled, &param),
               "Check failed: ReadProtoFromTextFile\\(param_file, param\\) "
               "Failed to parse NetParameter file: .*/garbled");
  EXPECT_DEATH(ReadNetParamsFromText("layers {", &param),
               "Check failed: ReadProtoFromTextFile1\\(param_file, param\\) "
               "Failed to parse NetParameter file: layers \\{");
  // A length-delimited field that runs past the end of the file.
  const std::string truncated = dir.write("truncated", std::string("\x0a\x7f", 2));
  EXPECT_DEATH(ReadNetParamsFromBinaryFile(truncated, &param),
               "Check failed: ReadProtoFromBinaryFile\\(param_file.c_str\\(\\), param\\) "
               "Failed to parse NetParameter file: .*/truncated");
}

TEST(IoDeathTest, WeightFilesAboveOneGibibyteAreRefused) {
  TempDir dir;
  const std::string path = WriteHugeNameMessage(dir, (uint64_t{1} << 30) + 1);
  NetParameter param;
  EXPECT_DEATH(ReadNetParamsFromBinaryFile(path, &param), "Failed to parse NetParameter file: ");
}

}  // namespace
}  // namespace nn
