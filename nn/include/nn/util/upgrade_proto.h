#ifndef NN_UTIL_UPGRADE_PROTO_H_
#define NN_UTIL_UPGRADE_PROTO_H_

#include "nn/proto/nn.pb.h"

namespace nn {

// True if any layer carries an old-generation V0LayerParameter; a message with
// only some such layers counts as old as a whole.
bool NetParameterIsV0(const NetParameter& param);

// Rewrites an old-generation description into the current form. Returns false
// if some parameter had no place in the new form (it is logged and dropped).
bool UpgradeV0Net(const NetParameter& v0_param, NetParameter* param);

}  // namespace nn

#endif  // NN_UTIL_UPGRADE_PROTO_H_
