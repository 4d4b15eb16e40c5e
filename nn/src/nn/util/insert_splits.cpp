#include "nn/util/insert_splits.h"

#include <glog/logging.h>

#include <map>
#include <sstream>
#include <utility>

namespace nn {

namespace {

// (layer index, top index); layer -1 stands for the net's inputs.
using Producer = std::pair<int, int>;

std::string SplitLayerName(const std::string& layer_name, const std::string& blob_name,
                           int blob_index) {
  std::ostringstream name;
  name << layer_name << "_" << blob_name << "_" << blob_index << "_split";
  return name.str();
}

void AddSplitLayer(const std::string& layer_name, const std::string& blob_name, int blob_index,
                   int split_count, LayerParameter* split) {
  split->Clear();
  split->add_bottom(blob_name);
  split->set_name(SplitLayerName(layer_name, blob_name, blob_index));
  split->set_type(LayerParameter::SPLIT);
  for (int k = 0; k < split_count; ++k) {
    split->add_top(SplitBlobName(layer_name, blob_name, blob_index, k));
  }
}

}  // namespace

std::string SplitBlobName(const std::string& layer_name, const std::string& blob_name,
                          int blob_index, int split_index) {
  if (split_index == 0) {
    return blob_name;
  }
  std::ostringstream name;
  name << layer_name << "_" << blob_name << "_" << blob_index << "_split_" << split_index;
  return name.str();
}

void InsertSplits(const NetParameter& param, NetParameter* param_split) {
  param_split->CopyFrom(param);
  param_split->clear_layers();

  std::map<std::string, Producer> last_producer;
  std::map<Producer, Producer> producer_of_consumer;
  std::map<Producer, int> consumer_count;
  std::map<int, std::string> layer_name;
  layer_name[-1] = "input";
  for (int i = 0; i < param.input_size(); ++i) {
    last_producer[param.input(i)] = Producer(-1, i);
  }
  for (int i = 0; i < param.layers_size(); ++i) {
    const LayerParameter& layer = param.layers(i);
    layer_name[i] = layer.name();
    for (int j = 0; j < layer.bottom_size(); ++j) {
      const std::string& blob = layer.bottom(j);
      auto found = last_producer.find(blob);
      if (found == last_producer.end()) {
        LOG(FATAL) << "Unknown blob input " << blob << " to layer " << j;
      }
      producer_of_consumer[Producer(i, j)] = found->second;
      ++consumer_count[found->second];
    }
    for (int j = 0; j < layer.top_size(); ++j) {
      // A later producer of the same name takes over: in-place layers chain.
      last_producer[layer.top(j)] = Producer(i, j);
    }
  }

  std::map<Producer, int> next_split_index;
  for (int i = 0; i < param.input_size(); ++i) {
    const int consumers = consumer_count[Producer(-1, i)];
    if (consumers > 1) {
      AddSplitLayer(layer_name[-1], param.input(i), i, consumers, param_split->add_layers());
    }
  }
  for (int i = 0; i < param.layers_size(); ++i) {
    LayerParameter* copy = param_split->add_layers();
    copy->CopyFrom(param.layers(i));
    for (int j = 0; j < copy->bottom_size(); ++j) {
      const Producer producer = producer_of_consumer[Producer(i, j)];
      if (consumer_count[producer] > 1) {
        copy->set_bottom(j, SplitBlobName(layer_name[producer.first], copy->bottom(j),
                                          producer.second, next_split_index[producer]++));
      }
    }
    const LayerParameter& layer = param.layers(i);
    for (int j = 0; j < layer.top_size(); ++j) {
      const int consumers = consumer_count[Producer(i, j)];
      if (consumers > 1) {
        AddSplitLayer(layer_name[i], layer.top(j), j, consumers, param_split->add_layers());
      }
    }
  }
}

}  // namespace nn
