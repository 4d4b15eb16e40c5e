#include "nn/util/upgrade_proto.h"

#include <glog/logging.h>
#include <google/protobuf/descriptor.h>

#include <cstdint>
#include <map>
#include <string>
#include <vector>

namespace nn {

namespace {

using google::protobuf::EnumValueDescriptor;
using google::protobuf::FieldDescriptor;
using google::protobuf::Message;
using google::protobuf::Reflection;

// Old layer type -> field of LayerParameter holding the parameter message
// that takes an old field for that type ("" for the layer itself).
using Places = std::map<std::string, std::string>;

// Where one old field goes. A type without a place makes the field unknown,
// even where the new parameter message has a field of that name.
struct OldField {
  const char* old_name;
  const char* new_name;
  Places places;
  // The name that complaints about the field use, where it isn't the old one.
  const char* complaint_name = nullptr;
};

// In the order in which their complaints appear.
const std::vector<OldField>& OldFields() {
  static const Places conv_and_inner_product = {{"conv", "convolution_param"},
                                                {"innerproduct", "inner_product_param"}};
  static const Places conv_and_pool = {{"conv", "convolution_param"}, {"pool", "pooling_param"}};
  static const Places conv = {{"conv", "convolution_param"}};
  static const Places pool = {{"pool", "pooling_param"}};
  static const Places lrn = {{"lrn", "lrn_param"}};
  static const Places images = {{"images", "image_data_param"}};
  static const Places window_data = {{"window_data", "window_data_param"}};
  static const Places data_and_images = {{"data", "data_param"}, {"images", "image_data_param"}};
  static const Places cropping_data = {
      {"data", "data_param"}, {"images", "image_data_param"}, {"window_data", "window_data_param"}};
  static const std::vector<OldField> fields = {
      {"num_output", "num_output", conv_and_inner_product},
      {"biasterm", "bias_term", conv_and_inner_product},
      {"weight_filler", "weight_filler", conv_and_inner_product},
      {"bias_filler", "bias_filler", conv_and_inner_product},
      {"pad", "pad", conv},
      {"kernelsize", "kernel_size", conv_and_pool},
      {"group", "group", conv},
      {"stride", "stride", conv_and_pool},
      {"pool", "pool", pool},
      {"dropout_ratio", "dropout_ratio", {{"dropout", "dropout_param"}}},
      {"local_size", "local_size", lrn},
      {"alpha", "alpha", lrn},
      {"beta", "beta", lrn},
      {"source",
       "source",
       {{"data", "data_param"},
        {"hdf5_data", "hdf5_data_param"},
        {"images", "image_data_param"},
        {"window_data", "window_data_param"},
        {"infogain_loss", "infogain_loss_param"}}},
      {"scale", "scale", data_and_images},
      {"meanfile", "mean_file", cropping_data},
      {"batchsize",
       "batch_size",
       {{"data", "data_param"},
        {"hdf5_data", "hdf5_data_param"},
        {"images", "image_data_param"},
        {"window_data", "window_data_param"}}},
      {"cropsize", "crop_size", cropping_data},
      {"mirror", "mirror", cropping_data},
      {"rand_skip", "rand_skip", data_and_images},
      {"shuffle_images", "shuffle", images, "shuffle"},
      {"new_height", "new_height", images},
      {"new_width", "new_width", images},
      {"concat_dim", "concat_dim", {{"concat", "concat_param"}}},
      {"det_fg_threshold", "fg_threshold", window_data},
      {"det_bg_threshold", "bg_threshold", window_data},
      {"det_fg_fraction", "fg_fraction", window_data},
      {"det_context_pad", "context_pad", window_data},
      {"det_crop_mode", "crop_mode", window_data},
      {"hdf5_output_param", "hdf5_output_param", {{"hdf5_output", ""}}},
  };
  return fields;
}

const FieldDescriptor* FieldNamed(const google::protobuf::Descriptor* message,
                                  const std::string& name) {
  const FieldDescriptor* field = message->FindFieldByName(name);
  CHECK(field != nullptr) << message->full_name() << " has no field " << name;
  return field;
}

// Copies a present singular field between fields of the same kind, but that
// the old image sizes were signed and the new ones aren't, and that the pool
// method, the only enumeration among the old fields, goes by its name.
bool CopyField(const Message& from, const FieldDescriptor* from_field, Message* to,
               const FieldDescriptor* to_field) {
  const Reflection* in = from.GetReflection();
  const Reflection* out = to->GetReflection();
  switch (to_field->cpp_type()) {
    case FieldDescriptor::CPPTYPE_UINT32:
      out->SetUInt32(to, to_field,
                     from_field->cpp_type() == FieldDescriptor::CPPTYPE_INT32
                         ? static_cast<uint32_t>(in->GetInt32(from, from_field))
                         : in->GetUInt32(from, from_field));
      return true;
    case FieldDescriptor::CPPTYPE_FLOAT:
      out->SetFloat(to, to_field, in->GetFloat(from, from_field));
      return true;
    case FieldDescriptor::CPPTYPE_BOOL:
      out->SetBool(to, to_field, in->GetBool(from, from_field));
      return true;
    case FieldDescriptor::CPPTYPE_STRING:
      out->SetString(to, to_field, in->GetString(from, from_field));
      return true;
    case FieldDescriptor::CPPTYPE_MESSAGE:
      out->MutableMessage(to, to_field)->CopyFrom(in->GetMessage(from, from_field));
      return true;
    case FieldDescriptor::CPPTYPE_ENUM: {
      const int number = in->GetEnumValue(from, from_field);
      const EnumValueDescriptor* old_value = from_field->enum_type()->FindValueByNumber(number);
      const EnumValueDescriptor* value =
          old_value == nullptr ? nullptr
                               : to_field->enum_type()->FindValueByName(old_value->name());
      if (value == nullptr) {
        LOG(ERROR) << "Unknown pool method " << number;
        return false;
      }
      out->SetEnum(to, to_field, value);
      return true;
    }
    default:
      LOG(FATAL) << "No upgrade for a field of the kind of " << to_field->full_name();
  }
}

}  // namespace

bool NetParameterIsV0(const NetParameter& param) {
  for (const LayerParameter& layer : param.layers()) {
    if (layer.has_layer()) {
      return true;
    }
  }
  return false;
}

bool UpgradeV0Net(const NetParameter& v0_param, NetParameter* param) {
  NetParameter padded_param;
  UpgradeV0PaddingLayers(v0_param, &padded_param);
  bool is_fully_compatible = true;
  param->Clear();
  if (padded_param.has_name()) {
    param->set_name(padded_param.name());
  }
  for (const LayerParameter& v0_layer : padded_param.layers()) {
    // Every layer is upgraded, also after a problem.
    is_fully_compatible =
        UpgradeLayerParameter(v0_layer, param->add_layers()) && is_fully_compatible;
  }
  param->mutable_input()->CopyFrom(padded_param.input());
  param->mutable_input_dim()->CopyFrom(padded_param.input_dim());
  if (padded_param.has_force_backward()) {
    param->set_force_backward(padded_param.force_backward());
  }
  return is_fully_compatible;
}

void UpgradeV0PaddingLayers(const NetParameter& v0_param, NetParameter* padded_param) {
  padded_param->CopyFrom(v0_param);
  padded_param->clear_layers();
  // Blob name -> index of the layer that last wrote it; -1 for net inputs.
  std::map<std::string, int> blob_name_to_last_top_idx;
  for (const std::string& input : v0_param.input()) {
    blob_name_to_last_top_idx[input] = -1;
  }
  for (int i = 0; i < v0_param.layers_size(); ++i) {
    const LayerParameter& layer_connection = v0_param.layers(i);
    const V0LayerParameter& layer_param = layer_connection.layer();
    if (layer_param.type() != "padding") {
      padded_param->add_layers()->CopyFrom(layer_connection);
    }
    for (int j = 0; j < layer_connection.bottom_size(); ++j) {
      const std::string& blob_name = layer_connection.bottom(j);
      const auto source = blob_name_to_last_top_idx.find(blob_name);
      if (source == blob_name_to_last_top_idx.end()) {
        LOG(FATAL) << "Unknown blob input " << blob_name << " to layer " << j;
      }
      if (source->second == -1) {
        continue;
      }
      const LayerParameter& source_layer = v0_param.layers(source->second);
      if (source_layer.layer().type() == "padding") {
        CHECK(layer_param.type() == "conv")
            << "Padding layer input to non-convolutional layer type " << layer_param.type();
        CHECK(layer_connection.bottom_size() == 1) << "Conv Layer takes a single blob as input.";
        CHECK(source_layer.bottom_size() == 1) << "Padding Layer takes a single blob as input.";
        CHECK(source_layer.top_size() == 1) << "Padding Layer produces a single blob as output.";
        LayerParameter* conv = padded_param->mutable_layers(padded_param->layers_size() - 1);
        conv->mutable_layer()->set_pad(source_layer.layer().pad());
        conv->set_bottom(j, source_layer.bottom(0));
      }
    }
    for (const std::string& top : layer_connection.top()) {
      blob_name_to_last_top_idx[top] = i;
    }
  }
}

bool UpgradeLayerParameter(const LayerParameter& v0_layer, LayerParameter* layer) {
  layer->Clear();
  layer->mutable_bottom()->CopyFrom(v0_layer.bottom());
  layer->mutable_top()->CopyFrom(v0_layer.top());
  if (!v0_layer.has_layer()) {
    return true;
  }
  const V0LayerParameter& v0 = v0_layer.layer();
  if (v0.has_name()) {
    layer->set_name(v0.name());
  }
  if (v0.has_type()) {
    layer->set_type(UpgradeLayerType(v0.type()));
  }
  layer->mutable_blobs()->CopyFrom(v0.blobs());
  layer->mutable_blobs_lr()->CopyFrom(v0.blobs_lr());
  layer->mutable_weight_decay()->CopyFrom(v0.weight_decay());

  bool is_fully_compatible = true;
  const Reflection* v0_reflection = v0.GetReflection();
  for (const OldField& old_field : OldFields()) {
    const FieldDescriptor* from_field =
        FieldNamed(V0LayerParameter::descriptor(), old_field.old_name);
    if (!v0_reflection->HasField(v0, from_field)) {
      continue;
    }
    const auto place = old_field.places.find(v0.type());
    if (place == old_field.places.end()) {
      LOG(ERROR) << "Unknown parameter "
                 << (old_field.complaint_name ? old_field.complaint_name : old_field.old_name)
                 << " for layer type " << v0.type();
      is_fully_compatible = false;
      continue;
    }
    Message* target = layer;
    if (!place->second.empty()) {
      target = layer->GetReflection()->MutableMessage(
          layer, FieldNamed(LayerParameter::descriptor(), place->second));
    }
    const FieldDescriptor* to_field = FieldNamed(target->GetDescriptor(), old_field.new_name);
    is_fully_compatible = CopyField(v0, from_field, target, to_field) && is_fully_compatible;
  }
  return is_fully_compatible;
}

LayerParameter::LayerType UpgradeLayerType(const std::string& type) {
  static const std::map<std::string, LayerParameter::LayerType> types = {
      {"accuracy", LayerParameter::ACCURACY},
      {"bnll", LayerParameter::BNLL},
      {"concat", LayerParameter::CONCAT},
      {"conv", LayerParameter::CONVOLUTION},
      {"data", LayerParameter::DATA},
      {"dropout", LayerParameter::DROPOUT},
      {"euclidean_loss", LayerParameter::EUCLIDEAN_LOSS},
      {"flatten", LayerParameter::FLATTEN},
      {"hdf5_data", LayerParameter::HDF5_DATA},
      {"hdf5_output", LayerParameter::HDF5_OUTPUT},
      {"im2col", LayerParameter::IM2COL},
      {"images", LayerParameter::IMAGE_DATA},
      {"infogain_loss", LayerParameter::INFOGAIN_LOSS},
      {"innerproduct", LayerParameter::INNER_PRODUCT},
      {"lrn", LayerParameter::LRN},
      {"multinomial_logistic_loss", LayerParameter::MULTINOMIAL_LOGISTIC_LOSS},
      {"pool", LayerParameter::POOLING},
      {"relu", LayerParameter::RELU},
      {"sigmoid", LayerParameter::SIGMOID},
      {"softmax", LayerParameter::SOFTMAX},
      {"softmax_loss", LayerParameter::SOFTMAX_LOSS},
      {"split", LayerParameter::SPLIT},
      {"tanh", LayerParameter::TANH},
      {"window_data", LayerParameter::WINDOW_DATA},
  };
  const auto found = types.find(type);
  if (found == types.end()) {
    LOG(FATAL) << "Unknown layer name: " << type;
  }
  return found->second;
}

}  // namespace nn
