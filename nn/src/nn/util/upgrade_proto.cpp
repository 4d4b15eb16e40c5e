#include "nn/util/upgrade_proto.h"

#include <glog/logging.h>

namespace nn {

bool NetParameterIsV0(const NetParameter& param) {
  for (const LayerParameter& layer : param.layers()) {
    if (layer.has_layer()) {
      return true;
    }
  }
  return false;
}

bool UpgradeV0Net(const NetParameter& v0_param, NetParameter* param) {
  LOG(FATAL) << "Cannot upgrade " << v0_param.name()
             << ": descriptions of the old generation are not supported by this build.";
  param->Clear();
  return false;
}

}  // namespace nn
