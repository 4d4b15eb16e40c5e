#include <glog/logging.h>
#include <leveldb/db.h>

#include "nn/data_layers.h"

namespace nn {

namespace {

void ParseDatum(const leveldb::Iterator& iter, Datum* datum) {
  const leveldb::Slice value = iter.value();
  CHECK(datum->ParseFromArray(value.data(), static_cast<int>(value.size())))
      << "The record of key " << iter.key().ToString() << " is not a Datum.";
}

}  // namespace

// The worker: fills one batch from the records under the iterator, starting
// over at the end of the database.
template <typename Dtype>
void DataLayerPrefetch(void* layer_pointer) {
  CHECK(layer_pointer);
  DataLayer<Dtype>* layer = static_cast<DataLayer<Dtype>*>(layer_pointer);
  CHECK(layer);
  CHECK(layer->prefetch_data_);
  const DataParameter& param = layer->layer_param_.data_param();
  Dtype* label = layer->output_labels_ ? layer->prefetch_label_->mutable_cpu_data() : nullptr;
  Datum datum;
  for (int item = 0; item < layer->prefetch_data_->num(); ++item) {
    CHECK(layer->iter_);
    CHECK(layer->iter_->Valid());
    ParseDatum(*layer->iter_, &datum);
    layer->TransformDatum(datum, item, param.crop_size(), param.mirror(), param.scale());
    if (label) {
      label[item] = datum.label();
    }
    layer->iter_->Next();
    if (!layer->iter_->Valid()) {
      layer->iter_->SeekToFirst();
    }
  }
}

template <typename Dtype>
DataLayer<Dtype>::~DataLayer() {
  this->JoinPrefetchThread();
  iter_.reset();
  db_.reset();
}

template <typename Dtype>
void DataLayer<Dtype>::SetUp(const std::vector<Blob<Dtype>*>& bottom,
                             std::vector<Blob<Dtype>*>* top) {
  CHECK_EQ(bottom.size(), 0) << "Data Layer takes no input blobs.";
  CHECK_GE(top->size(), 1) << "Data Layer takes at least one blob as output.";
  CHECK_LE(top->size(), 2) << "Data Layer takes at most two blobs as output.";
  output_labels_ = top->size() == 2;
  const DataParameter& param = this->layer_param_.data_param();

  leveldb::Options options;
  options.max_open_files = 100;
  options.create_if_missing = false;
  leveldb::DB* db = nullptr;
  const leveldb::Status status = leveldb::DB::Open(options, param.source(), &db);
  CHECK(status.ok()) << "Failed to open leveldb " << param.source() << std::endl
                     << status.ToString();
  db_.reset(db);
  iter_.reset(db_->NewIterator(leveldb::ReadOptions()));
  iter_->SeekToFirst();
  CHECK(iter_->Valid()) << "The leveldb " << param.source() << " holds no record.";
  if (param.rand_skip()) {
    unsigned int skip = Engine::rng_engine()() % param.rand_skip();
    while (skip-- > 0) {
      iter_->Next();
      if (!iter_->Valid()) {
        iter_->SeekToFirst();
      }
    }
  }
  Datum datum;
  ParseDatum(*iter_, &datum);
  this->SetUpBatches(datum, param.batch_size(), param.crop_size(), param.mean_file(), (*top)[0],
                     output_labels_ ? (*top)[1] : nullptr);
}

template <typename Dtype>
void DataLayer<Dtype>::CreatePrefetchThread() {
  const DataParameter& param = this->layer_param_.data_param();
  this->PreparePrefetch(param.mirror(), param.crop_size(), false);
  this->thread_ = std::thread(DataLayerPrefetch<Dtype>, static_cast<void*>(this));
}

template <typename Dtype>
unsigned int DataLayer<Dtype>::PrefetchRand() {
  CHECK(prefetch_rng_);
  return prefetch_rng_->engine()();
}

template class DataLayer<float>;

}  // namespace nn
