#include "nn/util/insert_splits.h"

#include <google/protobuf/text_format.h>
#include <gtest/gtest.h>

namespace nn {
namespace {

NetParameter Parse(const std::string& text) {
  NetParameter param;
  EXPECT_TRUE(google::protobuf::TextFormat::ParseFromString(text, &param));
  return param;
}

TEST(InsertSplitsTest, SharedBlobsGetASplitAndConsumersTheirOwnTops) {
  const NetParameter param = Parse(R"(
    input: "data"
    layers { name: "a" type: CONVOLUTION bottom: "data" top: "a" }
    layers { name: "relu" type: RELU bottom: "a" top: "a" }
    layers { name: "b" type: POOLING bottom: "data" top: "b" }
    layers { name: "c" type: CONCAT bottom: "a" bottom: "b" bottom: "a" top: "c" }
  )");
  NetParameter split;
  InsertSplits(param, &split);

  ASSERT_EQ(split.layers_size(), 6);
  const LayerParameter& input_split = split.layers(0);
  EXPECT_EQ(input_split.name(), "input_data_0_split");
  EXPECT_EQ(input_split.type(), LayerParameter::SPLIT);
  ASSERT_EQ(input_split.top_size(), 2);
  EXPECT_EQ(input_split.top(0), "data") << "the first consumer works in place";
  EXPECT_EQ(input_split.top(1), "input_data_0_split_1");
  EXPECT_EQ(split.layers(1).bottom(0), "data");
  EXPECT_EQ(split.layers(3).name(), "relu_a_0_split") << "behind the last producer of a";
  EXPECT_EQ(split.layers(3).top_size(), 2);
  EXPECT_EQ(split.layers(4).bottom(0), "input_data_0_split_1");
  const LayerParameter& concat = split.layers(5);
  EXPECT_EQ(concat.bottom(0), "a");
  EXPECT_EQ(concat.bottom(1), "b");
  EXPECT_EQ(concat.bottom(2), "relu_a_0_split_1");
}

TEST(InsertSplitsTest, SingleConsumersAreLeftAlone) {
  const NetParameter param = Parse(R"(
    name: "plain" input: "data"
    layers { name: "a" bottom: "data" top: "a" }
    layers { name: "b" bottom: "a" top: "b" }
  )");
  NetParameter split;
  InsertSplits(param, &split);
  EXPECT_EQ(split.SerializeAsString(), param.SerializeAsString());
}

TEST(InsertSplitsDeathTest, UnknownBottomIsFatal) {
  const NetParameter param = Parse(R"(
    input: "data"
    layers { name: "a" bottom: "data" bottom: "nothing" top: "a" }
  )");
  NetParameter split;
  EXPECT_DEATH(InsertSplits(param, &split), "Unknown blob input nothing to layer 1");
}

}  // namespace
}  // namespace nn
