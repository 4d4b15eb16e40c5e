#include <glog/logging.h>

#include <cstdint>

#include "nn/data_layers.h"
#include "nn/util/io.h"
#include "nn/util/math_functions.h"

namespace nn {

template <typename Dtype>
void PrefetchingDataLayer<Dtype>::JoinPrefetchThread() {
  if (thread_.joinable()) {
    thread_.join();
  }
}

template <typename Dtype>
Dtype PrefetchingDataLayer<Dtype>::Forward_cpu(const std::vector<Blob<Dtype>*>&,
                                               std::vector<Blob<Dtype>*>* top) {
  JoinPrefetchThread();
  cblas_scopy(prefetch_data_->count(), prefetch_data_->cpu_data(), 1,
              (*top)[0]->mutable_cpu_data(), 1);
  if (top->size() > 1) {
    cblas_scopy(prefetch_label_->count(), prefetch_label_->cpu_data(), 1,
                (*top)[1]->mutable_cpu_data(), 1);
  }
  CreatePrefetchThread();
  return Dtype(0);
}

template <typename Dtype>
void PrefetchingDataLayer<Dtype>::SetUpBatches(const Datum& datum, int batch_size, int crop_size,
                                               const std::string& mean_file,
                                               Blob<Dtype>* data_top, Blob<Dtype>* label_top) {
  CHECK_GT(batch_size, 0) << "A data layer needs a batch_size above 0.";
  const int height = crop_size > 0 ? crop_size : datum.height();
  const int width = crop_size > 0 ? crop_size : datum.width();
  data_top->Reshape(batch_size, datum.channels(), height, width);
  prefetch_data_.reset(new Blob<Dtype>(batch_size, datum.channels(), height, width));
  if (label_top) {
    label_top->Reshape(batch_size, 1, 1, 1);
    prefetch_label_.reset(new Blob<Dtype>(batch_size, 1, 1, 1));
  }
  datum_channels_ = datum.channels();
  datum_height_ = datum.height();
  datum_width_ = datum.width();
  datum_size_ = datum_channels_ * datum_height_ * datum_width_;
  CHECK_GT(datum_height_, crop_size);
  CHECK_GT(datum_width_, crop_size);

  if (!mean_file.empty()) {
    BlobProto blob_proto;
    ReadProtoFromBinaryFileOrDie(mean_file.c_str(), &blob_proto);
    data_mean_.FromProto(blob_proto);
  } else {
    data_mean_.Reshape(1, datum_channels_, datum_height_, datum_width_);
  }
  CHECK_EQ(data_mean_.num(), 1);
  CHECK_EQ(data_mean_.channels(), datum_channels_);
  CHECK_EQ(data_mean_.height(), datum_height_);
  CHECK_EQ(data_mean_.width(), datum_width_);

  // Allocated here, on the layer's thread, not in the worker.
  prefetch_data_->mutable_cpu_data();
  if (prefetch_label_) {
    prefetch_label_->mutable_cpu_data();
  }
  data_mean_.cpu_data();
  CreatePrefetchThread();
}

template <typename Dtype>
void PrefetchingDataLayer<Dtype>::PreparePrefetch(bool mirror, int crop_size,
                                                  bool always_seeded) {
  phase_ = Engine::phase();
  if (always_seeded || (phase_ == Engine::TRAIN && (mirror || crop_size > 0))) {
    // The worker draws from its own generator: the engine's is not shared.
    prefetch_rng_.reset(new Engine::RNG(Engine::rng_engine()()));
  } else {
    prefetch_rng_.reset();
  }
}

template <typename Dtype>
void PrefetchingDataLayer<Dtype>::TransformDatum(const Datum& datum, int item, int crop_size,
                                                 bool mirror, Dtype scale) {
  if (mirror && crop_size == 0) {
    LOG(FATAL) << "Current implementation requires mirror and crop_size to be "
               << "set at the same time.";
  }
  const std::string& data = datum.data();
  const Dtype* mean = data_mean_.cpu_data();
  Dtype* top_data = prefetch_data_->mutable_cpu_data();
  if (crop_size) {
    CHECK(data.size()) << "Image cropping only support uint8 data";
    int h_off;
    int w_off;
    if (phase_ == Engine::TRAIN) {
      // The last offset, datum size less crop, is never drawn.
      h_off = PrefetchRand() % (datum_height_ - crop_size);
      w_off = PrefetchRand() % (datum_width_ - crop_size);
    } else {
      h_off = (datum_height_ - crop_size) / 2;
      w_off = (datum_width_ - crop_size) / 2;
    }
    const bool flip = mirror && PrefetchRand() % 2;
    for (int c = 0; c < datum_channels_; ++c) {
      for (int h = 0; h < crop_size; ++h) {
        Dtype* top_row = top_data + ((item * datum_channels_ + c) * crop_size + h) * crop_size;
        for (int w = 0; w < crop_size; ++w) {
          const int data_index = (c * datum_height_ + h + h_off) * datum_width_ + w + w_off;
          const Dtype value = static_cast<Dtype>(static_cast<uint8_t>(data[data_index]));
          top_row[flip ? crop_size - 1 - w : w] = (value - mean[data_index]) * scale;
        }
      }
    }
    return;
  }
  Dtype* top_item = top_data + item * datum_size_;
  if (data.size()) {
    for (int j = 0; j < datum_size_; ++j) {
      const Dtype value = static_cast<Dtype>(static_cast<uint8_t>(data[j]));
      top_item[j] = (value - mean[j]) * scale;
    }
  } else {
    for (int j = 0; j < datum_size_; ++j) {
      top_item[j] = (datum.float_data(j) - mean[j]) * scale;
    }
  }
}

template class PrefetchingDataLayer<float>;

}  // namespace nn
