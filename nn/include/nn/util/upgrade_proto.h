#ifndef NN_UTIL_UPGRADE_PROTO_H_
#define NN_UTIL_UPGRADE_PROTO_H_

#include <string>

#include "nn/proto/nn.pb.h"

namespace nn {

// The upgrade of descriptions of the old generation, whose layers hold one
// flat V0LayerParameter (a type string and the parameters of every layer type
// side by side) and know a separate "padding" layer type. It is tolerant: a
// parameter without a place in its layer's new form is logged and dropped.
// Only wiring it cannot follow and unknown layer types end the process.
// The functions have no state; any number may run at once.

// True if any layer carries an old-generation V0LayerParameter; a message with
// only some such layers counts as old as a whole.
bool NetParameterIsV0(const NetParameter& param);

// Rewrites an old-generation description into the current form. Returns false
// if some parameter had no place in the new form (it is logged and dropped).
bool UpgradeV0Net(const NetParameter& v0_param, NetParameter* param);

// Folds every "padding" layer into the convolution that reads its output: the
// convolution takes the padding layer's input and its pad. The result is still
// of the old generation.
// REQUIRES: each padding layer has one bottom and one top and is read by
// "conv" layers of one bottom only; every bottom is produced by an earlier
// layer or is a net input. Otherwise the process ends.
void UpgradeV0PaddingLayers(const NetParameter& v0_param, NetParameter* padded_param);

// Upgrades one layer: wiring, name, type, parameter blobs and the parameters
// that have a place for the layer's type. A layer without the old part keeps
// its wiring and loses all else. Returns false if a parameter was dropped.
bool UpgradeLayerParameter(const LayerParameter& v0_layer, LayerParameter* layer);

// The current type for an old type string; an unknown string ends the process.
LayerParameter::LayerType UpgradeLayerType(const std::string& type);

}  // namespace nn

#endif  // NN_UTIL_UPGRADE_PROTO_H_
