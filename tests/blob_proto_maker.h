#ifndef TESTS_BLOB_PROTO_MAKER_H_
#define TESTS_BLOB_PROTO_MAKER_H_

#include <vector>

#include "nn/proto/nn.pb.h"

namespace nn {

// A serialised blob of the given shape and values, as weight files hold them.
inline BlobProto MakeBlob(int num, int channels, int height, int width,
                          const std::vector<float>& data) {
  BlobProto blob;
  blob.set_num(num);
  blob.set_channels(channels);
  blob.set_height(height);
  blob.set_width(width);
  blob.mutable_data()->Add(data.begin(), data.end());
  return blob;
}

}  // namespace nn

#endif  // TESTS_BLOB_PROTO_MAKER_H_
