#ifndef NN_DATA_LAYERS_H_
#define NN_DATA_LAYERS_H_

#include <boost/shared_ptr.hpp>

#include <string>
#include <thread>
#include <vector>

#include "nn/blob.h"
#include "nn/engine.h"
#include "nn/layer.h"
#include "nn/proto/nn.pb.h"

namespace cv {
class Mat;
}  // namespace cv

namespace leveldb {
class DB;
class Iterator;
}  // namespace leveldb

namespace nn {

// The layers that feed a net from a source of their own, with no bottoms.
//
// ImageDataLayer and DataLayer read one batch ahead on a worker thread: SetUp
// starts the first worker, and each forward pass joins it, copies the batch
// out and starts the next, so the read overlaps the rest of the net. While a
// worker runs it owns the batch blobs, the record source and the private
// generator prefetch_rng_; the layer's thread touches them only after a join,
// which is all the synchronisation there is. Destruction joins the worker.
// Apart from that, a data layer is as single-threaded as the net it sits in.

// What the two prefetching layers share: the shape of one record, the batch
// being filled, the mean and the phase the worker runs in. Each subclass
// joins the worker in its destructor, before its own record source goes.
template <typename Dtype>
class PrefetchingDataLayer : public Layer<Dtype> {
 public:
  explicit PrefetchingDataLayer(const LayerParameter& param) : Layer<Dtype>(param) {}

  // Stores the phase, seeds or drops prefetch_rng_ and starts a worker.
  virtual void CreatePrefetchThread() = 0;
  // Waits for the worker, if one runs.
  virtual void JoinPrefetchThread();
  // A draw of the worker's private generator.
  virtual unsigned int PrefetchRand() = 0;

 protected:
  // The batch is the one read during the previous pass.
  Dtype Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                    std::vector<Blob<Dtype>*>* top) override;
  // Data has no gradient.
  void Backward_cpu(const std::vector<Blob<Dtype>*>&, bool, std::vector<Blob<Dtype>*>*) override {}

  // Shapes the tops and the batch blobs from the first record, loads the mean
  // and starts the first worker. label_top is null for a layer without labels.
  void SetUpBatches(const Datum& datum, int batch_size, int crop_size, const std::string& mean_file,
                    Blob<Dtype>* data_top, Blob<Dtype>* label_top);
  // Stores the engine's phase for the next worker and gives it a generator
  // seeded from the engine's when it will draw: in training with mirroring or
  // cropping, or in any phase when always_seeded.
  void PreparePrefetch(bool mirror, int crop_size, bool always_seeded);
  // Writes item `item` of prefetch_data_ from a record: cropped (at random
  // offsets in training, centred otherwise) and mirrored on request, less the
  // mean, times scale. Runs on the worker.
  void TransformDatum(const Datum& datum, int item, int crop_size, bool mirror, Dtype scale);

  boost::shared_ptr<Engine::RNG> prefetch_rng_;
  int datum_channels_ = 0;
  int datum_height_ = 0;
  int datum_width_ = 0;
  int datum_size_ = 0;
  std::thread thread_;
  boost::shared_ptr<Blob<Dtype>> prefetch_data_;
  boost::shared_ptr<Blob<Dtype>> prefetch_label_;
  Blob<Dtype> data_mean_;
  Engine::Phase phase_ = Engine::TRAIN;
};

// Serves images held in memory (8-bit, three channels), one after the other,
// with a label of 0. A net hands its active images over during assembly;
// without any the layer works on one blank image of new_height squared.
template <typename Dtype>
class ImageDataLayer : public PrefetchingDataLayer<Dtype> {
 public:
  explicit ImageDataLayer(const LayerParameter& param) : PrefetchingDataLayer<Dtype>(param) {}
  ~ImageDataLayer() override;

  // REQUIRES: called before SetUp.
  void set_active_images(const std::vector<boost::shared_ptr<cv::Mat>>& images) {
    activeImagePtrs_ = images;
  }

  void SetUp(const std::vector<Blob<Dtype>*>& bottom, std::vector<Blob<Dtype>*>* top) override;
  void CreatePrefetchThread() override;
  // Unchecked: without a generator (mirroring outside training, no shuffle)
  // it dereferences a null pointer.
  unsigned int PrefetchRand() override;

 private:
  template <typename T>
  friend void ImageDataLayerPrefetch(void* layer_pointer);

  using PrefetchingDataLayer<Dtype>::prefetch_rng_;

  int lines_id_ = 0;
  std::vector<boost::shared_ptr<cv::Mat>> activeImagePtrs_;
};

// Serves the Datum records of a leveldb database in key order, starting over
// at the end without a sign to the net. One top (data) or two (data, label).
template <typename Dtype>
class DataLayer : public PrefetchingDataLayer<Dtype> {
 public:
  explicit DataLayer(const LayerParameter& param) : PrefetchingDataLayer<Dtype>(param) {}
  // Joins the worker, then releases the iterator before the database.
  ~DataLayer() override;

  void SetUp(const std::vector<Blob<Dtype>*>& bottom, std::vector<Blob<Dtype>*>* top) override;
  void CreatePrefetchThread() override;
  unsigned int PrefetchRand() override;

 private:
  template <typename T>
  friend void DataLayerPrefetch(void* layer_pointer);

  using PrefetchingDataLayer<Dtype>::prefetch_rng_;

  boost::shared_ptr<leveldb::DB> db_;
  boost::shared_ptr<leveldb::Iterator> iter_;
  bool output_labels_ = false;
};

// Would serve batches of an array handed to it, without copying. Nothing in
// the system hands one over, so a forward pass ends the process.
template <typename Dtype>
class MemoryDataLayer : public Layer<Dtype> {
 public:
  explicit MemoryDataLayer(const LayerParameter& param) : Layer<Dtype>(param) {}
  void SetUp(const std::vector<Blob<Dtype>*>& bottom, std::vector<Blob<Dtype>*>* top) override;

 protected:
  Dtype Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                    std::vector<Blob<Dtype>*>* top) override;
  void Backward_cpu(const std::vector<Blob<Dtype>*>&, bool, std::vector<Blob<Dtype>*>*) override {}

 private:
  Dtype* data_ = nullptr;
  Dtype* labels_ = nullptr;
  int datum_channels_ = 0;
  int datum_height_ = 0;
  int datum_width_ = 0;
  int datum_size_ = 0;
  int batch_size_ = 0;
  int n_ = 0;
  int pos_ = 0;
};

}  // namespace nn

#endif  // NN_DATA_LAYERS_H_
