// Forward passes of the four cascade nets, and the convolution layers against
// bare matrix products of the same shapes. Weights come from the fillers.
//
//   OPENBLAS_NUM_THREADS=1 build/benchmarks/nn_benchmark
//
// Layer/<net>/<layer> times each layer of a net at its declared size. For a
// convolution compare it with Gemm/<net>/<layer>, the bare product of the
// same shape: the difference is the unfolding (im2col) and the bias product.
#include <benchmark/benchmark.h>

#include <memory>
#include <string>
#include <vector>

#include "detector/cascade_net_texts.h"
#include "nn/net.h"
#include "nn/util/math_functions.h"

namespace {

using nn::Blob;
using nn::Net;
using nn::NetDescription;

struct CascadeNet {
  const char* label;
  const char* text;
};

const CascadeNet kNets[] = {{"stage0", tavilib::kStage0NetText},
                            {"stage1", tavilib::kStage1NetText},
                            {"stage2", tavilib::kStage2NetText},
                            {"calibration", tavilib::kCalibrationNetText}};

void FillInput(Net<float>& net) {
  Blob<float>* input = net.net_input_blobs()[0];
  float* data = input->mutable_cpu_data();
  for (int i = 0; i < input->count(); ++i) {
    data[i] = static_cast<float>((i * 37) % 256);
  }
}

void BM_Forward(benchmark::State& state, const char* text) {
  Net<float> net(text, NetDescription::kText);
  FillInput(net);
  for (auto _ : state) {
    benchmark::DoNotOptimize(net.Forward()[0]->cpu_data());
  }
}

// The scan net primed, then run at a pyramid level's size.
void BM_ScanLevel(benchmark::State& state) {
  Net<float> net(tavilib::kStage0NetText, NetDescription::kText);
  net.FirstRun();
  const int width = static_cast<int>(state.range(0));
  const int height = static_cast<int>(state.range(1));
  net.AlterInputShape(width, height);
  FillInput(net);
  for (auto _ : state) {
    benchmark::DoNotOptimize(net.FF()[0]->cpu_data());
  }
  state.counters["cells"] = net.output_blob()->height() * net.output_blob()->width();
}

void BM_Layer(benchmark::State& state, std::shared_ptr<Net<float>> net, size_t layer) {
  auto& bottom = net->bottom_vecs()[layer];
  auto top = net->top_vecs()[layer];
  for (auto _ : state) {
    net->layers()[layer]->Forward(bottom, &top);
    benchmark::DoNotOptimize(top[0]->cpu_data());
  }
}

void BM_Gemm(benchmark::State& state, int m, int n, int k) {
  std::vector<float> a(static_cast<size_t>(m) * k, 0.5f);
  std::vector<float> b(static_cast<size_t>(k) * n, 0.25f);
  std::vector<float> c(static_cast<size_t>(m) * n);
  for (auto _ : state) {
    cblas_sgemm(CblasRowMajor, CblasNoTrans, CblasNoTrans, m, n, k, 1.0f, a.data(), k, b.data(),
                n, 0.0f, c.data(), n);
    benchmark::DoNotOptimize(c.data());
  }
}

void RegisterBenchmarks() {
  for (const CascadeNet& net : kNets) {
    benchmark::RegisterBenchmark((std::string("Forward/") + net.label).c_str(), BM_Forward,
                                 net.text)
        ->Unit(benchmark::kMicrosecond);
  }
  benchmark::RegisterBenchmark("ScanLevel", BM_ScanLevel)
      ->Args({384, 384})
      ->Args({240, 180})
      ->Args({160, 120})
      ->Args({106, 80})
      ->Args({70, 53})
      ->Unit(benchmark::kMicrosecond);

  for (const CascadeNet& cascade : kNets) {
    auto net = std::make_shared<Net<float>>(cascade.text, NetDescription::kText);
    FillInput(*net);
    net->Forward();
    for (size_t i = 0; i < net->layers().size(); ++i) {
      const std::string name = std::string(cascade.label) + "/" + net->layer_names()[i];
      benchmark::RegisterBenchmark(("Layer/" + name).c_str(), BM_Layer, net, i)
          ->Unit(benchmark::kMicrosecond);
      if (net->layers()[i]->layer_param().type() != nn::LayerParameter::CONVOLUTION) {
        continue;
      }
      const Blob<float>& in = *net->bottom_vecs()[i][0];
      const Blob<float>& out = *net->top_vecs()[i][0];
      const int kernel = net->layers()[i]->layer_param().convolution_param().kernel_size();
      const int m = out.channels();
      const int n = out.height() * out.width();
      const int k = in.channels() * kernel * kernel;
      benchmark::RegisterBenchmark(("Gemm/" + name).c_str(), BM_Gemm, m, n, k)
          ->Unit(benchmark::kMicrosecond);
    }
  }
}

}  // namespace

int main(int argc, char** argv) {
  benchmark::Initialize(&argc, argv);
  RegisterBenchmarks();
  benchmark::RunSpecifiedBenchmarks();
  benchmark::Shutdown();
  return 0;
}
