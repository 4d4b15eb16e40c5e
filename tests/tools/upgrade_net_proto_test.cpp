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

struct ToolRun {
  int exit_status;  // -1 if the tool did not exit normally
  std::string errors;
};

std::string ReadFile(const std::string& path) {
  std::ifstream file(path, std::ios::binary);
  std::ostringstream contents;
  contents << file.rdbuf();
  return contents.str();
}

ToolRun RunTool(const std::string& tool, const std::vector<std::string>& args, const TempDir& dir) {
  std::string command = tool;
  for (const std::string& arg : args) {
    command += " '" + arg + "'";
  }
  const std::string errors = dir.path() + "/tool-stderr";
  command += " >/dev/null 2>'" + errors + "'";
  const int status = std::system(command.c_str());
  return {WIFEXITED(status) ? WEXITSTATUS(status) : -1, ReadFile(errors)};
}

nn::NetParameter ParseText(const std::string& text) {
  nn::NetParameter param;
  EXPECT_TRUE(google::protobuf::TextFormat::ParseFromString(text, &param)) << text;
  return param;
}

const char kV0Net[] = R"(
name: "old"
input: "data"
input_dim: 1 input_dim: 1 input_dim: 8 input_dim: 8
layers { layer { name: "pad" type: "padding" pad: 1 } bottom: "data" top: "padded" }
layers {
  layer {
    name: "conv" type: "conv" num_output: 1 kernelsize: 1 meanfile: "stray"
    blobs { num: 1 channels: 1 height: 1 width: 1 data: 0.1 }
  }
  bottom: "padded" top: "conv"
}
)";

const char kCurrentNet[] = R"(
name: "old"
input: "data"
input_dim: 1 input_dim: 1 input_dim: 8 input_dim: 8
layers {
  name: "conv" type: CONVOLUTION bottom: "data" top: "conv"
  blobs { num: 1 channels: 1 height: 1 width: 1 data: 0.1 }
  convolution_param { num_output: 1 pad: 1 kernel_size: 1 }
}
)";

TEST(UpgradeNetProtoTest, ToolsUpgradeOldFilesAndKeepCurrentOnes) {
  struct Form {
    const char* tool;
    std::string old_file;
    bool (*read)(const std::string& filename, google::protobuf::Message* proto);
  };
  const Form forms[] = {
      {kTextTool, kV0Net,
       [](const std::string& filename, google::protobuf::Message* proto) {
         return nn::ReadProtoFromTextFile(filename, proto);
       }},
      {kBinaryTool, ParseText(kV0Net).SerializeAsString(),
       [](const std::string& filename, google::protobuf::Message* proto) {
         return nn::ReadProtoFromBinaryFile(filename.c_str(), proto);
       }},
  };
  for (const Form& form : forms) {
    SCOPED_TRACE(form.tool);
    TempDir dir;
    const std::string upgraded = dir.path() + "/upgraded";
    const ToolRun run = RunTool(form.tool, {dir.write("old", form.old_file), upgraded}, dir);
    EXPECT_EQ(run.exit_status, 0);
    EXPECT_THAT(run.errors, HasSubstr("Unknown parameter meanfile for layer type conv"));

    nn::NetParameter written;
    ASSERT_TRUE(form.read(upgraded, &written));
    EXPECT_EQ(written.DebugString(), ParseText(kCurrentNet).DebugString());

    // A current file goes through unchanged.
    const std::string again = dir.path() + "/again";
    EXPECT_EQ(RunTool(form.tool, {upgraded, again}, dir).exit_status, 0);
    EXPECT_EQ(ReadFile(again), ReadFile(upgraded));
  }
}

void ExpectRefusal(const std::string& tool, const std::vector<std::string>& args,
                   const TempDir& dir, const std::string& message) {
  const ToolRun run = RunTool(tool, args, dir);
  EXPECT_NE(run.exit_status, 0) << message;
  EXPECT_THAT(run.errors, HasSubstr(message));
}

TEST(UpgradeNetProtoTest, ToolsRefuseWrongArgumentsAndUnusableFiles) {
  TempDir dir;
  const std::string text = dir.write("net.prototxt", kCurrentNet);
  const std::string binary = dir.write("net.binaryproto", std::string("\xff\xff\xff", 3));
  const std::string output = dir.path() + "/out";

  for (const char* tool : {kTextTool, kBinaryTool}) {
    const std::string name = std::filesystem::path(tool).filename().string();
    for (const std::vector<std::string>& args :
         {std::vector<std::string>{}, {text}, {text, output, output}}) {
      ExpectRefusal(tool, args, dir, "Usage: " + name + " INPUT OUTPUT");
    }
    const std::string missing = dir.path() + "/missing";
    ExpectRefusal(tool, {missing, output}, dir, name + ": cannot read " + missing);
    ExpectRefusal(tool, {dir.path(), output}, dir, name + ": cannot read " + dir.path() + "\n");
  }
  ExpectRefusal(kTextTool, {binary, output}, dir, binary + " is not a network text description");
  ExpectRefusal(kBinaryTool, {text, output}, dir, text + " is not a network binary weight file");
  EXPECT_FALSE(std::filesystem::exists(output)) << "nothing is written on failure";

  const std::string unwritable = dir.path() + "/no/such/folder";
  ExpectRefusal(kTextTool, {text, unwritable}, dir, "cannot write " + unwritable);
}

}  // namespace
