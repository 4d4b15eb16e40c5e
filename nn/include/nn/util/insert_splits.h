#ifndef NN_UTIL_INSERT_SPLITS_H_
#define NN_UTIL_INSERT_SPLITS_H_

#include <string>

#include "nn/proto/nn.pb.h"

namespace nn {

// A blob has one consumer in this engine. Copies param to param_split with a
// SPLIT layer inserted behind every blob (net inputs included) that feeds
// several layers; each consumer then reads its own top of the split.
void InsertSplits(const NetParameter& param, NetParameter* param_split);

// Name of top split_index of the split layer behind top blob_index (named
// blob_name) of layer layer_name. Top 0 keeps the blob's own name, so the
// split works in place for its first consumer.
std::string SplitBlobName(const std::string& layer_name, const std::string& blob_name,
                          int blob_index, int split_index);

}  // namespace nn

#endif  // NN_UTIL_INSERT_SPLITS_H_
