#include <glog/logging.h>

#include <algorithm>
#include <cmath>

#include "nn/neuron_layers.h"

namespace nn {

template <typename Dtype>
void NeuronLayer<Dtype>::SetUp(const std::vector<Blob<Dtype>*>& bottom,
                               std::vector<Blob<Dtype>*>* top) {
  CHECK_EQ(bottom.size(), 1) << "Neuron Layer takes a single blob as input.";
  CHECK_EQ(top->size(), 1) << "Neuron Layer takes a single blob as output.";
  if ((*top)[0] != bottom[0]) {
    (*top)[0]->Reshape(bottom[0]->num(), bottom[0]->channels(), bottom[0]->height(),
                       bottom[0]->width());
  }
}

namespace {

// Applies forward(x) element by element, bottom to top (possibly in place).
template <typename Dtype, typename Function>
void MapForward(const std::vector<Blob<Dtype>*>& bottom, std::vector<Blob<Dtype>*>* top,
                Function forward) {
  const Dtype* x = bottom[0]->cpu_data();
  Dtype* y = (*top)[0]->mutable_cpu_data();
  const int count = bottom[0]->count();
  for (int i = 0; i < count; ++i) {
    y[i] = forward(x[i]);
  }
}

// bottom_diff = derivative(x, y) * top_diff, element by element.
template <typename Dtype, typename Function>
void MapBackward(const std::vector<Blob<Dtype>*>& top, bool propagate_down,
                 std::vector<Blob<Dtype>*>* bottom, Function derivative) {
  if (!propagate_down) {
    return;
  }
  const Dtype* y = top[0]->cpu_data();
  const Dtype* top_diff = top[0]->cpu_diff();
  const Dtype* x = (*bottom)[0]->cpu_data();
  Dtype* bottom_diff = (*bottom)[0]->mutable_cpu_diff();
  const int count = (*bottom)[0]->count();
  for (int i = 0; i < count; ++i) {
    bottom_diff[i] = top_diff[i] * derivative(x[i], y[i]);
  }
}

}  // namespace

template <typename Dtype>
Dtype ReLULayer<Dtype>::Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                                    std::vector<Blob<Dtype>*>* top) {
  // Written so that a NaN stays NaN.
  MapForward(bottom, top, [](Dtype x) { return x < Dtype(0) ? Dtype(0) : x; });
  return Dtype(0);
}

template <typename Dtype>
void ReLULayer<Dtype>::Backward_cpu(const std::vector<Blob<Dtype>*>& top, bool propagate_down,
                                    std::vector<Blob<Dtype>*>* bottom) {
  // In place the bottom holds the rectified value, whose sign tells the same.
  MapBackward(top, propagate_down, bottom,
              [](Dtype x, Dtype) { return x > Dtype(0) ? Dtype(1) : Dtype(0); });
}

template <typename Dtype>
Dtype SigmoidLayer<Dtype>::Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                                       std::vector<Blob<Dtype>*>* top) {
  MapForward(bottom, top, [](Dtype x) { return Dtype(1) / (Dtype(1) + std::exp(-x)); });
  return Dtype(0);
}

template <typename Dtype>
void SigmoidLayer<Dtype>::Backward_cpu(const std::vector<Blob<Dtype>*>& top, bool propagate_down,
                                       std::vector<Blob<Dtype>*>* bottom) {
  MapBackward(top, propagate_down, bottom, [](Dtype, Dtype y) { return y * (Dtype(1) - y); });
}

template <typename Dtype>
Dtype TanHLayer<Dtype>::Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                                    std::vector<Blob<Dtype>*>* top) {
  MapForward(bottom, top, [](Dtype x) {
    const Dtype e = std::exp(Dtype(2) * x);
    return (e - Dtype(1)) / (e + Dtype(1));
  });
  return Dtype(0);
}

template <typename Dtype>
void TanHLayer<Dtype>::Backward_cpu(const std::vector<Blob<Dtype>*>& top, bool propagate_down,
                                    std::vector<Blob<Dtype>*>* bottom) {
  MapBackward(top, propagate_down, bottom, [](Dtype, Dtype y) { return Dtype(1) - y * y; });
}

template <typename Dtype>
Dtype BNLLLayer<Dtype>::Forward_cpu(const std::vector<Blob<Dtype>*>& bottom,
                                    std::vector<Blob<Dtype>*>* top) {
  MapForward(bottom, top, [](Dtype x) {
    return x > Dtype(0) ? x + std::log(Dtype(1) + std::exp(-x)) : std::log(Dtype(1) + std::exp(x));
  });
  return Dtype(0);
}

template <typename Dtype>
void BNLLLayer<Dtype>::Backward_cpu(const std::vector<Blob<Dtype>*>& top, bool propagate_down,
                                    std::vector<Blob<Dtype>*>* bottom) {
  MapBackward(top, propagate_down, bottom, [](Dtype x, Dtype) {
    const Dtype e = std::exp(std::min(x, Dtype(50)));
    return e / (e + Dtype(1));
  });
}

template class NeuronLayer<float>;
template class ReLULayer<float>;
template class SigmoidLayer<float>;
template class TanHLayer<float>;
template class BNLLLayer<float>;

}  // namespace nn
