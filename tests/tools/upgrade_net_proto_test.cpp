#include <gmock/gmock.h>
#include <google/protobuf/text_format.h>
#include <gtest/gtest.h>
#include <sys/wait.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>
#include <vector>

#include "nn/proto/nn.pb.h"
#include "nn/util/io.h"
#include "temp_dir.h"

namespace {

using testing::HasSubstr;

const char kTextTool[] = UPGRADE_NET_PROTO_TEXT;
const char kBinaryTool[] = UPGRADE_NET_PROTO_BINARY;

std::string ReadFile(const std::string& path) {
  std::ostringstream contents;
  contents << std::ifstream(path, std::ios::binary).rdbuf();
  return contents.str();
}

// The tool's exit status (-1 if it did not exit normally); its stderr goes to *errors.
int RunTool(const std::string& tool, const std::vector<std::string>& args, const TempDir& dir,
            std::string* errors) {
  std::string command = tool;
  for (const std::string& arg : args) command += " '" + arg + "'";
  const int status = std::system((command + " >/dev/null 2>'" + dir.path() + "/stderr'").c_str());
  *errors = ReadFile(dir.path() + "/stderr");
  return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

nn::NetParameter Parse(const std::string& text) {
  nn::NetParameter param;
  EXPECT_TRUE(google::protobuf::TextFormat::ParseFromString(text, &param)) << text;
  return param;
}

const char kCurrentNet[] = R"(name: "old" input: "data" layers {
  name: "conv" type: CONVOLUTION bottom: "data" top: "conv" convolution_param { pad: 1 } })";

TEST(UpgradeNetProtoTest, ToolsUpgradeOldFilesAndKeepCurrentOnes) {
  const nn::NetParameter v0 = Parse(R"(name: "old" input: "data"
    layers { layer { name: "pad" type: "padding" pad: 1 } bottom: "data" top: "padded" }
    layers { layer { name: "conv" type: "conv" meanfile: "stray" }
             bottom: "padded" top: "conv" })");
  for (const bool binary : {false, true}) {
    const char* tool = binary ? kBinaryTool : kTextTool;
    SCOPED_TRACE(tool);
    TempDir dir;
    std::string old_file = v0.SerializeAsString();
    if (!binary) google::protobuf::TextFormat::PrintToString(v0, &old_file);
    const std::string upgraded = dir.path() + "/upgraded";
    std::string errors;
    EXPECT_EQ(RunTool(tool, {dir.write("old", old_file), upgraded}, dir, &errors), 0);
    EXPECT_THAT(errors, HasSubstr("Unknown parameter meanfile for layer type conv"));
    nn::NetParameter written;
    ASSERT_TRUE(binary ? nn::ReadProtoFromBinaryFile(upgraded.c_str(), &written)
                       : nn::ReadProtoFromTextFile(upgraded, &written));
    EXPECT_EQ(written.DebugString(), Parse(kCurrentNet).DebugString());

    // A current file goes through unchanged.
    EXPECT_EQ(RunTool(tool, {upgraded, dir.path() + "/again"}, dir, &errors), 0);
    EXPECT_EQ(ReadFile(dir.path() + "/again"), ReadFile(upgraded));
  }
}

TEST(UpgradeNetProtoTest, ToolsRefuseWrongArgumentsAndUnusableFiles) {
  TempDir dir;
  const std::string text = dir.write("net.prototxt", kCurrentNet);
  const std::string binary = dir.write("net.binaryproto", "\xff\xff\xff");
  const std::string out = dir.path() + "/out";
  const std::string unwritable = dir.path() + "/no/such/folder";
  const struct {
    const char* tool;
    std::vector<std::string> args;
    std::string message;
  } cases[] = {
      {kTextTool, {}, "Usage: upgrade_net_proto_text.bin INPUT OUTPUT"},
      {kBinaryTool, {text, out, out}, "Usage: upgrade_net_proto_binary.bin INPUT OUTPUT"},
      {kTextTool, {dir.path(), out}, "cannot read " + dir.path() + "\n"},  // not an empty net
      {kTextTool, {binary, out}, binary + " is not a network text description"},
      {kBinaryTool, {text, out}, text + " is not a network binary weight file"},
      {kTextTool, {text, unwritable}, "cannot write " + unwritable},
  };
  for (const auto& c : cases) {
    std::string errors;
    EXPECT_NE(RunTool(c.tool, c.args, dir, &errors), 0) << c.message;
    EXPECT_THAT(errors, HasSubstr(c.message));
  }
  EXPECT_FALSE(std::filesystem::exists(out)) << "nothing is written on failure";
}

}  // namespace
