#include "nn/util/io.h"

#include <google/protobuf/text_format.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <memory>
#include <sstream>
#include <string>
#include <vector>

#include "gradient_checker.h"
#include "nn/data_layers.h"
#include "nn/util/upgrade_proto.h"
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

  NetParameter empty;
  ReadNetParamsFromTextFile(dir.write("empty.prototxt", ""), &empty);
  EXPECT_EQ(empty.ByteSizeLong(), 0u);
}

TEST(IoTest, BinaryFilesRoundTripAndMayPassTheOldDefaultLimit) {
  const auto weights = Parse<NetParameter>("layers { name: 'fc' blobs { width: 2 data: [1, 2] } }");
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

using testing::internal::CaptureStderr;
using testing::internal::GetCapturedStderr;

// The messages of the log lines in captured stderr, without their prefixes.
std::vector<std::string> LoggedMessages(const std::string& captured) {
  std::vector<std::string> messages;
  std::istringstream lines(captured);
  for (std::string line; std::getline(lines, line);) {
    messages.push_back(line.substr(line.find("] ") + 2));
  }
  return messages;
}

// An old net whose padding layers stand behind a net input, behind another
// layer (overriding the convolution's own pad) and in front of nothing. One
// convolution has a stray parameter; the first layer is of the current
// generation already, and keeps only its wiring.
const char kV0Net[] = R"(
name: "cascade12" input: "data" input_dim: 1 input_dim: 3 input_dim: 12 force_backward: true
layers { name: "r" type: RELU bottom: "data" top: "r" }
layers { layer { type: "padding" pad: 2 } bottom: "data" top: "p1" }
layers { layer { name: "c1" type: "conv" num_output: 16 biasterm: false kernelsize: 3 group: 2
                 stride: 3 weight_filler { type: "xavier" } bias_filler { value: 0.5 }
                 blobs { num: 1 } blobs { num: 2 } blobs_lr: 1 weight_decay: 0 source: "stray" }
         bottom: "p1" top: "c1" }
layers { layer { name: "pool" type: "pool" pool: STOCHASTIC kernelsize: 3 stride: 2 }
         bottom: "c1" top: "pool" }
layers { layer { type: "padding" pad: 1 } bottom: "pool" top: "p2" }
layers { layer { name: "c2" type: "conv" pad: 9 } bottom: "p2" top: "c2" }
layers { layer { type: "padding" pad: 5 } bottom: "c2" top: "unread" })";

const char kCurrentNet[] = R"(
name: "cascade12" input: "data" input_dim: 1 input_dim: 3 input_dim: 12 force_backward: true
layers { bottom: "data" top: "r" }
layers { name: "c1" type: CONVOLUTION bottom: "data" top: "c1"
         blobs { num: 1 } blobs { num: 2 } blobs_lr: 1 weight_decay: 0
         convolution_param { num_output: 16 bias_term: false pad: 2 kernel_size: 3 group: 2
                             stride: 3 weight_filler { type: "xavier" }
                             bias_filler { value: 0.5 } } }
layers { name: "pool" type: POOLING bottom: "c1" top: "pool"
         pooling_param { pool: STOCHASTIC kernel_size: 3 stride: 2 } }
layers { name: "c2" type: CONVOLUTION bottom: "pool" top: "c2" convolution_param { pad: 1 } })";

TEST(UpgradeProtoTest, OldDescriptionsReadAsTheirCurrentForms) {
  TempDir dir;
  for (const bool binary : {false, true}) {
    const std::string file =
        binary ? dir.write("old.binaryproto", Parse<NetParameter>(kV0Net).SerializeAsString())
               : dir.write("old.prototxt", kV0Net);
    const std::vector<std::string> lines = {
        "Attempting to upgrade input file specified using deprecated V0LayerParameter: " + file,
        "Unknown parameter source for layer type conv",
        "Warning: had one or more problems upgrading V0NetParameter to NetParameter (see above); "
        "continuing anyway.",
        std::string("Note that future releases will not support V0NetParameter; use ") +
            (binary ? "./build/tools/upgrade_net_proto_binary.bin"
                    : "./build/tools/upgrade_net_proto_text.bin") +
            " to upgrade this and any other network proto files to the new format."};
    NetParameter param;
    CaptureStderr();
    (binary ? ReadNetParamsFromBinaryFile : ReadNetParamsFromTextFile)(file, &param);
    EXPECT_EQ(LoggedMessages(GetCapturedStderr()), lines);
    EXPECT_EQ(param.DebugString(), Parse<NetParameter>(kCurrentNet).DebugString());
  }
}

TEST(UpgradeProtoTest, OldParametersGoToTheirPlaceOrAreLoggedAndDropped) {
  const struct {
    const char* v0;
    const char* current;
    std::vector<std::string> lines;  // none: the upgrade reports success
  } cases[] = {
      {"type: 'images' source: 'l' scale: 2 meanfile: 'm' batchsize: 5 cropsize: 6 mirror: true"
       " rand_skip: 9 shuffle_images: true new_height: 30 new_width: 40 new_num: 3 new_channels: 4",
       "type: IMAGE_DATA image_data_param { source: 'l' scale: 2 mean_file: 'm' batch_size: 5"
       " crop_size: 6 mirror: true rand_skip: 9 shuffle: true new_height: 30 new_width: 40 }", {}},
      // Places the new message has but the upgrade doesn't give.
      {"type: 'pool' pad: 1", "type: POOLING", {"Unknown parameter pad for layer type pool"}},
      {"type: 'data' shuffle_images: true", "type: DATA",
       {"Unknown parameter shuffle for layer type data"}},
      // In the order of the old fields, not of the text.
      {"type: 'relu' concat_dim: 2 num_output: 1", "type: RELU",
       {"Unknown parameter num_output for layer type relu",
        "Unknown parameter concat_dim for layer type relu"}},
      // Without a type every parameter is unknown, and the type stays unset.
      {"name: 'x' kernelsize: 3", "name: 'x'", {"Unknown parameter kernelsize for layer type "}},
  };
  for (const auto& c : cases) {
    const std::string wiring = "bottom: 'in' top: 'out' ";
    const LayerParameter v0 = Parse<LayerParameter>(wiring + "layer { " + c.v0 + " }");
    LayerParameter layer;
    CaptureStderr();
    EXPECT_EQ(UpgradeLayerParameter(v0, &layer), c.lines.empty()) << c.v0;
    EXPECT_EQ(LoggedMessages(GetCapturedStderr()), c.lines) << c.v0;
    EXPECT_EQ(layer.DebugString(), Parse<LayerParameter>(wiring + c.current).DebugString());
  }
}

TEST(UpgradeProtoDeathTest, WiringItCannotFollowAndUnknownTypesEndTheProcess) {
  const std::string padding = "layers { layer { type: 'padding' } bottom: 'a' top: 'p' }\n";
  const struct {
    std::string layers;  // reading the net input a
    const char* message;
  } cases[] = {
      // The number is the bottom's position in its layer.
      {"layers { layer { type: 'concat' } bottom: 'a' bottom: 'x' }",
       "Unknown blob input x to layer 1"},
      {padding + "layers { layer { type: 'pool' } bottom: 'p' }",
       "Check failed: layer_param.type\\(\\) == \"conv\" "
       "Padding layer input to non-convolutional layer type pool"},
      {padding + "layers { layer { type: 'padding' } bottom: 'p' top: 'q' }\n"
                 "layers { layer { type: 'conv' } bottom: 'q' }",
       "Padding layer input to non-convolutional layer type padding"},
      // Type names compare exactly.
      {"layers { layer { type: 'Conv' } }", "Unknown layer name: Conv"},
  };
  for (const auto& c : cases) {
    const NetParameter v0 = Parse<NetParameter>("input: 'a'\n" + c.layers);
    NetParameter upgraded;
    EXPECT_DEATH(UpgradeV0Net(v0, &upgraded), c.message);
  }
}

// Every field set in `expected` is what a message that never set it reads.
template <typename Proto>
void ExpectDefaults(const std::string& expected_text) {
  const Proto expected = Parse<Proto>(expected_text);
  const Proto unset;
  std::vector<const google::protobuf::FieldDescriptor*> fields;
  expected.GetReflection()->ListFields(expected, &fields);
  for (const auto* field : fields) {
    std::string want, got;
    google::protobuf::TextFormat::PrintFieldValueToString(expected, field, -1, &want);
    google::protobuf::TextFormat::PrintFieldValueToString(unset, field, -1, &got);
    EXPECT_EQ(got, want) << field->full_name();
  }
}

TEST(NnProtoTest, DefaultsAreThoseTheTrainedModelsAssume) {
  ExpectDefaults<FillerParameter>(
      "type: 'constant' value: 0 min: 0 max: 1 mean: 0 std: 1 sparse: -1");
  ExpectDefaults<ConvolutionParameter>("bias_term: true pad: 0 group: 1 stride: 1");
  ExpectDefaults<PoolingParameter>("pool: MAX stride: 1 pad: 0");
  ExpectDefaults<LRNParameter>("local_size: 5 alpha: 1 beta: 0.75 norm_region: ACROSS_CHANNELS");
  ExpectDefaults<InnerProductParameter>("bias_term: true");
  ExpectDefaults<ConcatParameter>("concat_dim: 1");
  ExpectDefaults<DropoutParameter>("dropout_ratio: 0.5");
  ExpectDefaults<PowerParameter>("power: 1 scale: 1 shift: 0");
  ExpectDefaults<DataParameter>("scale: 1 crop_size: 0 mirror: false rand_skip: 0");
  ExpectDefaults<ImageDataParameter>("shuffle: false new_height: 0 new_width: 0");
  ExpectDefaults<V0LayerParameter>(
      "biasterm: true pool: MAX local_size: 5 det_crop_mode: 'warp' concat_dim: 1");
}

LayerParameter Param(int type) {
  LayerParameter param = Parse<LayerParameter>("name: 'x'");
  param.set_type(static_cast<LayerParameter::LayerType>(type));
  return param;
}

// The numbers are those stored in weight files. Each type but NONE and
// WINDOW_DATA gets a layer made with the whole parameter, but the HDF5 ones;
// layer tests build their layers through the factory, which checks the classes.
TEST(LayerFactoryDeathTest, TypeNumbersAreThoseOfTheWeightFilesAndGiveTheirLayers) {
  const google::protobuf::EnumDescriptor* types = LayerParameter::LayerType_descriptor();
  std::string names;
  for (int number = 0; number < types->value_count(); ++number) {
    names += types->FindValueByNumber(number)->name() + " ";
  }
  EXPECT_EQ(names,
            "NONE ACCURACY BNLL CONCAT CONVOLUTION DATA DROPOUT EUCLIDEAN_LOSS FLATTEN HDF5_DATA "
            "HDF5_OUTPUT IM2COL IMAGE_DATA INFOGAIN_LOSS INNER_PRODUCT LRN "
            "MULTINOMIAL_LOGISTIC_LOSS POOLING RELU SIGMOID SOFTMAX SOFTMAX_LOSS SPLIT TANH "
            "WINDOW_DATA ELTWISE_PRODUCT POWER SIGMOID_CROSS_ENTROPY_LOSS HINGE_LOSS MEMORY_DATA ");
  const auto make = [](int number) {
    return std::unique_ptr<Layer<float>>(number == 24 ? nullptr : GetLayer<float>(Param(number)));
  };
  for (int number = 1; number < 30; ++number) {
    const bool none = number == 9 || number == 10 || number == 24;
    EXPECT_EQ(make(number) ? make(number)->layer_param().name() : "", none ? "" : "x") << number;
  }
  EXPECT_TRUE(dynamic_cast<DataLayer<float>*>(make(5).get()));
  EXPECT_TRUE(dynamic_cast<ImageDataLayer<float>*>(make(12).get()));
  EXPECT_TRUE(dynamic_cast<MemoryDataLayer<float>*>(make(29).get()));
  EXPECT_DEATH(GetLayer<float>(Param(LayerParameter::NONE)), "Layer x has unspecified type.");
  EXPECT_DEATH(GetLayer<float>(Param(LayerParameter::WINDOW_DATA)), "Layer x has unknown type 24");
  EXPECT_DEATH(GetLayer<float>(Param(30)), "Layer x has unknown type 30");
}

}  // namespace
}  // namespace nn
