#include "nn/util/upgrade_proto.h"

#include <google/protobuf/text_format.h>
#include <gtest/gtest.h>

#include <sstream>
#include <string>
#include <vector>

#include "nn/util/io.h"
#include "temp_dir.h"

namespace nn {
namespace {

using testing::internal::CaptureStderr;
using testing::internal::GetCapturedStderr;

template <typename Proto>
Proto Parse(const std::string& text) {
  Proto proto;
  EXPECT_TRUE(google::protobuf::TextFormat::ParseFromString(text, &proto)) << text;
  return proto;
}

// The messages of the log lines in captured stderr, without their prefixes.
std::vector<std::string> LoggedMessages(const std::string& captured) {
  std::vector<std::string> messages;
  std::istringstream lines(captured);
  for (std::string line; std::getline(lines, line);) {
    const size_t end_of_prefix = line.find("] ");
    messages.push_back(end_of_prefix == std::string::npos ? line : line.substr(end_of_prefix + 2));
  }
  return messages;
}

// A small detection net of the old generation: a padding layer in front of
// its convolution, and one stray parameter that has no place.
const char kV0Net[] = R"(
name: "cascade12"
input: "data"
input_dim: 1 input_dim: 3 input_dim: 12 input_dim: 12
force_backward: true
layers { layer { name: "pad1" type: "padding" pad: 2 } bottom: "data" top: "pad1" }
layers {
  layer {
    name: "conv1" type: "conv" num_output: 16 kernelsize: 3 source: "stray"
    blobs { num: 1 channels: 1 height: 1 width: 2 data: 0.25 data: -1.5 }
    blobs_lr: 1 blobs_lr: 2 weight_decay: 1 weight_decay: 0
  }
  bottom: "pad1" top: "conv1"
}
layers {
  layer { name: "pool1" type: "pool" pool: AVE kernelsize: 3 stride: 2 }
  bottom: "conv1" top: "pool1"
}
layers { layer { name: "relu1" type: "relu" } bottom: "pool1" top: "pool1" }
)";

const char kCurrentNet[] = R"(
name: "cascade12"
input: "data"
input_dim: 1 input_dim: 3 input_dim: 12 input_dim: 12
force_backward: true
layers {
  name: "conv1" type: CONVOLUTION bottom: "data" top: "conv1"
  blobs { num: 1 channels: 1 height: 1 width: 2 data: 0.25 data: -1.5 }
  blobs_lr: 1 blobs_lr: 2 weight_decay: 1 weight_decay: 0
  convolution_param { num_output: 16 pad: 2 kernel_size: 3 }
}
layers {
  name: "pool1" type: POOLING bottom: "conv1" top: "pool1"
  pooling_param { pool: AVE kernel_size: 3 stride: 2 }
}
layers { name: "relu1" type: RELU bottom: "pool1" top: "pool1" }
)";

std::vector<std::string> ExpectedReaderLines(const std::string& file, const std::string& tool) {
  return {"Attempting to upgrade input file specified using deprecated V0LayerParameter: " + file,
          "Unknown parameter source for layer type conv",
          "Warning: had one or more problems upgrading V0NetParameter to NetParameter (see "
          "above); continuing anyway.",
          "Note that future releases will not support V0NetParameter; use ./build/tools/" + tool +
              " to upgrade this and any other network proto files to the new format."};
}

TEST(UpgradeProtoTest, OldDescriptionsReadAsTheirCurrentForms) {
  struct Form {
    std::string file;
    void (*read)(const std::string& file, NetParameter* param);
    const char* tool;
  };
  TempDir dir;
  const Form forms[] = {
      {dir.write("old.prototxt", kV0Net), ReadNetParamsFromTextFile, "upgrade_net_proto_text.bin"},
      {dir.write("old.binaryproto", Parse<NetParameter>(kV0Net).SerializeAsString()),
       ReadNetParamsFromBinaryFile, "upgrade_net_proto_binary.bin"},
  };
  for (const Form& form : forms) {
    NetParameter param;
    CaptureStderr();
    form.read(form.file, &param);
    EXPECT_EQ(LoggedMessages(GetCapturedStderr()), ExpectedReaderLines(form.file, form.tool));
    EXPECT_EQ(param.DebugString(), Parse<NetParameter>(kCurrentNet).DebugString());
  }
}

TEST(UpgradeProtoTest, NetIsOldIfAnyLayerIs) {
  EXPECT_FALSE(NetParameterIsV0(NetParameter()));
  EXPECT_FALSE(NetParameterIsV0(Parse<NetParameter>("layers { name: \"a\" type: RELU }")));
  const NetParameter mixed = Parse<NetParameter>(
      "input: \"x\"\n"
      "layers { name: \"a\" type: RELU bottom: \"x\" top: \"y\" }\n"
      "layers { layer { name: \"b\" type: \"relu\" } bottom: \"y\" top: \"z\" }");
  EXPECT_TRUE(NetParameterIsV0(mixed));

  // The current layer among old ones keeps its wiring and nothing else.
  NetParameter upgraded;
  EXPECT_TRUE(UpgradeV0Net(mixed, &upgraded));
  EXPECT_EQ(upgraded.DebugString(),
            Parse<NetParameter>("input: \"x\"\n"
                                "layers { bottom: \"x\" top: \"y\" }\n"
                                "layers { name: \"b\" type: RELU bottom: \"y\" top: \"z\" }")
                .DebugString());
  EXPECT_FALSE(NetParameterIsV0(upgraded));
}

TEST(UpgradeProtoTest, EveryOldParameterFindsItsPlace) {
  struct Case {
    const char* v0;
    const char* current;
  };
  const Case cases[] = {
      {"name: \"c\" type: \"conv\" num_output: 8 biasterm: false weight_filler { type: \"xavier\" }"
       " bias_filler { value: 0.5 } pad: 1 kernelsize: 5 group: 2 stride: 3"
       " blobs { num: 2 } blobs { num: 3 } blobs_lr: 1 weight_decay: 0.5",
       "name: \"c\" type: CONVOLUTION blobs { num: 2 } blobs { num: 3 } blobs_lr: 1"
       " weight_decay: 0.5 convolution_param { num_output: 8 bias_term: false pad: 1"
       " kernel_size: 5 group: 2 stride: 3 weight_filler { type: \"xavier\" }"
       " bias_filler { value: 0.5 } }"},
      {"type: \"pool\" pool: STOCHASTIC kernelsize: 3 stride: 2",
       "type: POOLING pooling_param { pool: STOCHASTIC kernel_size: 3 stride: 2 }"},
      {"type: \"images\" source: \"l\" scale: 2 meanfile: \"m\" batchsize: 5 cropsize: 6"
       " mirror: true rand_skip: 9 shuffle_images: true new_height: 30 new_width: 40",
       "type: IMAGE_DATA image_data_param { source: \"l\" scale: 2 mean_file: \"m\" batch_size: 5"
       " crop_size: 6 mirror: true rand_skip: 9 shuffle: true new_height: 30 new_width: 40 }"},
      {"type: \"window_data\" source: \"w\" meanfile: \"m\" batchsize: 8 cropsize: 9 mirror: true"
       " det_fg_threshold: 0.6 det_bg_threshold: 0.4 det_fg_fraction: 0.3 det_context_pad: 16"
       " det_crop_mode: \"square\"",
       "type: WINDOW_DATA window_data_param { source: \"w\" mean_file: \"m\" batch_size: 8"
       " crop_size: 9 mirror: true fg_threshold: 0.6 bg_threshold: 0.4 fg_fraction: 0.3"
       " context_pad: 16 crop_mode: \"square\" }"},
      {"type: \"hdf5_output\" hdf5_output_param { file_name: \"out.h5\" }",
       "type: HDF5_OUTPUT hdf5_output_param { file_name: \"out.h5\" }"},
      // Fields without a place, but ignored without a word.
      {"type: \"images\" new_num: 3 new_channels: 4", "type: IMAGE_DATA"},
  };
  for (const Case& c : cases) {
    const LayerParameter v0 =
        Parse<LayerParameter>(std::string("bottom: \"in\" top: \"out\" layer { ") + c.v0 + " }");
    LayerParameter layer;
    CaptureStderr();
    EXPECT_TRUE(UpgradeLayerParameter(v0, &layer)) << c.v0;
    EXPECT_EQ(GetCapturedStderr(), "") << c.v0;
    const LayerParameter expected =
        Parse<LayerParameter>(std::string("bottom: \"in\" top: \"out\" ") + c.current);
    EXPECT_EQ(layer.DebugString(), expected.DebugString()) << c.v0;
  }
}

TEST(UpgradeProtoTest, ParametersWithoutAPlaceAreLoggedAndDropped) {
  struct Case {
    const char* v0;
    const char* current;
    std::vector<std::string> lines;
  };
  const Case cases[] = {
      // What has a place stays.
      {"type: \"conv\" num_output: 4 source: \"db\"",
       "type: CONVOLUTION convolution_param { num_output: 4 }",
       {"Unknown parameter source for layer type conv"}},
      // Places the new message has but the upgrade doesn't give.
      {"type: \"pool\" pad: 1", "type: POOLING", {"Unknown parameter pad for layer type pool"}},
      {"type: \"window_data\" scale: 2",
       "type: WINDOW_DATA",
       {"Unknown parameter scale for layer type window_data"}},
      {"type: \"data\" shuffle_images: true",
       "type: DATA",
       {"Unknown parameter shuffle for layer type data"}},
      // In the order of the old fields, not of the text.
      {"type: \"relu\" hdf5_output_param { file_name: \"f\" } concat_dim: 2 new_width: 3"
       " num_output: 1",
       "type: RELU",
       {"Unknown parameter num_output for layer type relu",
        "Unknown parameter new_width for layer type relu",
        "Unknown parameter concat_dim for layer type relu",
        "Unknown parameter hdf5_output_param for layer type relu"}},
      // Without a type every parameter is unknown, and the type stays unset.
      {"name: \"x\" kernelsize: 3 mirror: true",
       "name: \"x\"",
       {"Unknown parameter kernelsize for layer type ",
        "Unknown parameter mirror for layer type "}},
  };
  for (const Case& c : cases) {
    LayerParameter v0;
    v0.mutable_layer()->CopyFrom(Parse<V0LayerParameter>(c.v0));
    LayerParameter layer;
    CaptureStderr();
    EXPECT_FALSE(UpgradeLayerParameter(v0, &layer)) << c.v0;
    EXPECT_EQ(LoggedMessages(GetCapturedStderr()), c.lines) << c.v0;
    EXPECT_EQ(layer.DebugString(), Parse<LayerParameter>(c.current).DebugString()) << c.v0;
  }
}

TEST(UpgradeProtoTest, PoolMethodBeyondTheThreeIsLoggedAndDropped) {
#ifndef NDEBUG
  GTEST_SKIP() << "only code can store such a value, and debug builds assert on it";
#else
  LayerParameter v0;
  v0.mutable_layer()->set_type("pool");
  v0.mutable_layer()->set_pool(static_cast<V0LayerParameter::PoolMethod>(7));
  v0.mutable_layer()->set_kernelsize(2);
  LayerParameter layer;
  CaptureStderr();
  EXPECT_FALSE(UpgradeLayerParameter(v0, &layer));
  EXPECT_EQ(LoggedMessages(GetCapturedStderr()), std::vector<std::string>{"Unknown pool method 7"});
  EXPECT_FALSE(layer.pooling_param().has_pool());
  EXPECT_EQ(layer.pooling_param().kernel_size(), 2u);
#endif
}

TEST(UpgradeProtoTest, PaddingLayersFoldIntoTheirConvolutions) {
  // Behind a net input, and behind another layer.
  NetParameter upgraded;
  EXPECT_TRUE(UpgradeV0Net(
      Parse<NetParameter>(
          "input: \"data\"\n"
          "layers { layer { type: \"padding\" pad: 1 } bottom: \"data\" top: \"p1\" }\n"
          "layers { layer { name: \"c1\" type: \"conv\" } bottom: \"p1\" top: \"c1\" }\n"
          "layers { layer { type: \"padding\" pad: 3 } bottom: \"c1\" top: \"p2\" }\n"
          "layers { layer { name: \"c2\" type: \"conv\" pad: 9 } bottom: \"p2\" top: \"c2\" }"),
      &upgraded));
  EXPECT_EQ(
      upgraded.DebugString(),
      Parse<NetParameter>("input: \"data\"\n"
                          "layers { name: \"c1\" type: CONVOLUTION bottom: \"data\" top: \"c1\""
                          " convolution_param { pad: 1 } }\n"
                          "layers { name: \"c2\" type: CONVOLUTION bottom: \"c1\" top: \"c2\""
                          " convolution_param { pad: 3 } }")
          .DebugString());

  // A padding layer nobody reads leaves no trace.
  NetParameter padded;
  UpgradeV0PaddingLayers(
      Parse<NetParameter>(
          "input: \"data\"\n"
          "layers { layer { type: \"padding\" pad: 1 } bottom: \"data\" top: \"unread\" }\n"
          "layers { layer { type: \"conv\" } bottom: \"data\" top: \"c\" }"),
      &padded);
  EXPECT_EQ(padded.DebugString(),
            Parse<NetParameter>("input: \"data\"\n"
                                "layers { layer { type: \"conv\" } bottom: \"data\" top: \"c\" }")
                .DebugString());
}

// Folds the padding layers of old layers that read the net inputs a and b.
void FoldPadding(const std::string& layers) {
  NetParameter padded;
  UpgradeV0PaddingLayers(Parse<NetParameter>("input: \"a\" input: \"b\"\n" + layers), &padded);
}

TEST(UpgradeProtoDeathTest, WiringThatCannotBeFollowedEndsTheProcess) {
  // The number is the bottom's position in its layer.
  EXPECT_DEATH(FoldPadding("layers { layer { type: \"concat\" } bottom: \"a\" bottom: \"x\" }"),
               "Unknown blob input x to layer 1");
  const std::string padding = "layers { layer { type: \"padding\" } bottom: \"a\" top: \"p\" }\n";
  EXPECT_DEATH(FoldPadding(padding + "layers { layer { type: \"pool\" } bottom: \"p\" }"),
               "Check failed: layer_param.type\\(\\) == \"conv\" "
               "Padding layer input to non-convolutional layer type pool");
  EXPECT_DEATH(
      FoldPadding(padding + "layers { layer { type: \"padding\" } bottom: \"p\" top: \"q\" }\n"
                            "layers { layer { type: \"conv\" } bottom: \"q\" }"),
      "Padding layer input to non-convolutional layer type padding");
  EXPECT_DEATH(
      FoldPadding(padding + "layers { layer { type: \"conv\" } bottom: \"p\" bottom: \"b\" }"),
      "Check failed: layer_connection.bottom_size\\(\\) == 1 "
      "Conv Layer takes a single blob as input.");
  EXPECT_DEATH(
      FoldPadding("layers { layer { type: \"padding\" } bottom: \"a\" bottom: \"b\" top: \"p\" }\n"
                  "layers { layer { type: \"conv\" } bottom: \"p\" }"),
      "Check failed: source_layer.bottom_size\\(\\) == 1 "
      "Padding Layer takes a single blob as input.");
  EXPECT_DEATH(
      FoldPadding("layers { layer { type: \"padding\" } bottom: \"a\" top: \"p\" top: \"q\" }\n"
                  "layers { layer { type: \"conv\" } bottom: \"p\" }"),
      "Check failed: source_layer.top_size\\(\\) == 1 "
      "Padding Layer produces a single blob as output.");
}

TEST(UpgradeProtoDeathTest, UnknownLayerTypesEndTheProcess) {
  EXPECT_DEATH(UpgradeLayerType("Conv"), "Unknown layer name: Conv");
  NetParameter upgraded;
  EXPECT_DEATH(UpgradeV0Net(Parse<NetParameter>("layers { layer { type: \"eltwise_product\" } }"),
                            &upgraded),
               "Unknown layer name: eltwise_product");
}

}  // namespace
}  // namespace nn
