#include "nn/util/io.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <string>

#include "temp_dir.h"

namespace nn {
namespace {

// A binary NetParameter whose name field declares name_length bytes, written
// as a sparse file so that huge messages cost no disk.
std::string WriteHugeNameMessage(const TempDir& dir, uint64_t name_length) {
  std::string header = "\x0a";
  uint64_t v = name_length;
  for (; v >= 0x80; v >>= 7) {
    header += static_cast<char>((v & 0x7f) | 0x80);
  }
  header += static_cast<char>(v);
  const std::string path = dir.write("huge.binaryproto", header);
  EXPECT_EQ(truncate(path.c_str(), static_cast<off_t>(header.size() + name_length)), 0);
  return path;
}

TEST(IoTest, TextFileAndTextInMemoryGiveTheSameDescription) {
  const std::string text =
      "name: \"tiny\"\t\t\t\ninput: \"data\"\n# a comment line\n"
      "layers { name: \"conv1\" type: CONVOLUTION }\n"
      "layers { name: \"probs\" type: SOFTMAX bottom: \"conv1\" top: \"probs\" }";  // no newline
  TempDir dir;
  NetParameter from_file;
  ReadNetParamsFromTextFile(dir.write("net.prototxt", text), &from_file);
  NetParameter from_text;
  ReadNetParamsFromText(text, &from_text);
  EXPECT_EQ(from_file.DebugString(), from_text.DebugString());
  ASSERT_EQ(from_file.layers_size(), 2) << "the last line, without a newline, is read too";
  EXPECT_EQ(from_file.layers(1).top(0), "probs");

  NetParameter empty;
  ReadNetParamsFromTextFile(dir.write("empty.prototxt", ""), &empty);
  EXPECT_EQ(empty.ByteSizeLong(), 0u);
}

TEST(IoTest, BinaryFilesRoundTripAndMayPassTheOldDefaultLimit) {
  NetParameter weights;
  weights.add_layers()->set_name("fc");
  BlobProto* blob = weights.mutable_layers(0)->add_blobs();
  blob->set_width(2);
  blob->add_data(0.5f);
  blob->add_data(-1.5f);
  TempDir dir;
  NetParameter read;
  ReadNetParamsFromBinaryFile(dir.write("weights", weights.SerializeAsString()), &read);
  EXPECT_EQ(read.DebugString(), weights.DebugString());

  EXPECT_TRUE(ReadProtoFromBinaryFile(WriteHugeNameMessage(dir, 70u << 20).c_str(), &read));
  EXPECT_EQ(read.name().size(), 70u << 20);
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
  EXPECT_DEATH(ReadNetParamsFromTextFile(dir.write("garbled", "layers { type: NO_SUCH }"), &param),
               "Check failed: ReadProtoFromTextFile\\(param_file, param\\) "
               "Failed to parse NetParameter file: .*/garbled");
  EXPECT_DEATH(ReadNetParamsFromText("layers {", &param),
               "Check failed: ReadProtoFromTextFile1\\(param_file, param\\) "
               "Failed to parse NetParameter file: layers \\{");
  // A length-delimited field that runs past the end of the file.
  EXPECT_DEATH(ReadNetParamsFromBinaryFile(dir.write("cut", std::string("\x0a\x7f", 2)), &param),
               "Check failed: ReadProtoFromBinaryFile\\(param_file.c_str\\(\\), param\\) "
               "Failed to parse NetParameter file: .*/cut");
  // Weight files above one gibibyte are refused.
  EXPECT_DEATH(ReadNetParamsFromBinaryFile(WriteHugeNameMessage(dir, (1u << 30) + 1), &param),
               "Failed to parse NetParameter file: ");
}

}  // namespace
}  // namespace nn
