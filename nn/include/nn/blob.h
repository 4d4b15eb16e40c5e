#ifndef NN_BLOB_H_
#define NN_BLOB_H_

#include <boost/shared_ptr.hpp>

#include "nn/proto/nn.pb.h"
#include "nn/syncedmem.h"

namespace nn {

// A dense four-dimensional tensor (num, channels, height, width), row-major
// with width fastest, holding a data array and a gradient array of one shape.
// Both arrays are lazily allocated SyncedMemory objects that may be shared
// with other blobs (ShareData, ShareDiff); the last owner frees them.
//
// The shape header can be rewritten in place (RewriteShape) without touching
// memory: the header then describes the front of the buffer allocated for the
// earlier, larger shape. That is what lets a net run smaller inputs in the
// buffers of its declared size.
//
// Not thread-safe; a blob belongs to one net, and a net to one thread.
template <typename Dtype>
class Blob {
 public:
  Blob() = default;
  Blob(int num, int channels, int height, int width);
  Blob(const Blob&) = delete;
  Blob& operator=(const Blob&) = delete;

  // Always replaces both memories, even for the same shape: the new arrays
  // read as zeros and sharers of the old ones keep them.
  void Reshape(int num, int channels, int height, int width);
  // Writes the header only; neither memory nor its size changes.
  void RewriteShape(int num, int channels, int height, int width);

  int num() const { return num_; }
  int channels() const { return channels_; }
  int height() const { return height_; }
  int width() const { return width_; }
  int count() const { return count_; }

  // REQUIRES: 0 <= n <= num(); c <= channels(); h <= height(); w <= width().
  // The lower bounds of c, h and w are not checked, and an index one past the
  // end of a dimension passes.
  int offset(int n, int c = 0, int h = 0, int w = 0) const;

  const Dtype* cpu_data() const;
  Dtype* mutable_cpu_data();
  const Dtype* cpu_diff() const;
  Dtype* mutable_cpu_diff();
  void set_cpu_data(Dtype* data);

  const boost::shared_ptr<SyncedMemory>& data() const;
  const boost::shared_ptr<SyncedMemory>& diff() const;

  // REQUIRES: other.count() == count().
  void ShareData(const Blob& other);
  void ShareDiff(const Blob& other);

  void FromProto(const BlobProto& proto);
  void ToProto(BlobProto* proto, bool write_diff = false) const;

 private:
  boost::shared_ptr<SyncedMemory> data_;
  boost::shared_ptr<SyncedMemory> diff_;
  int num_ = 0;
  int channels_ = 0;
  int height_ = 0;
  int width_ = 0;
  int count_ = 0;
};

}  // namespace nn

#endif  // NN_BLOB_H_
