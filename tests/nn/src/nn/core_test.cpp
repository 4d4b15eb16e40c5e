#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <limits>
#include <memory>
#include <numeric>
#include <string>
#include <utility>
#include <vector>

#include "gradient_checker.h"
#include "nn/blob.h"
#include "nn/engine.h"
#include "nn/filler.h"
#include "nn/syncedmem.h"
#include "nn/util/math_functions.h"

namespace nn {
namespace {

TEST(SyncedMemoryTest, ZeroedBufferAtFirstTouchOnlyAndAdoptedBuffersAreNotOwned) {
  SyncedMemory memory(64);
  const auto* bytes = static_cast<const unsigned char*>(memory.cpu_data());
  EXPECT_EQ(memory.head(), SyncedMemory::HEAD_AT_CPU);
  EXPECT_EQ(std::vector<unsigned char>(bytes, bytes + 64), std::vector<unsigned char>(64, 0));
  auto* writable = static_cast<unsigned char*>(memory.mutable_cpu_data());
  EXPECT_EQ(writable, bytes) << "a second touch must not reallocate";
  writable[5] = 7;
  EXPECT_EQ(static_cast<const unsigned char*>(memory.cpu_data())[5], 7) << "zero fill runs once";

  std::vector<float> foreign(4, 2.5f);
  {
    SyncedMemory adopter(foreign.size() * sizeof(float));
    adopter.mutable_cpu_data();  // owned buffer, freed by set_cpu_data
    adopter.set_cpu_data(foreign.data());
    EXPECT_EQ(static_cast<const float*>(adopter.cpu_data())[3], 2.5f) << "no zero fill";
  }
  foreign[0] = 1.0f;  // still ours after the memory object is gone
  EXPECT_DEATH(memory.set_cpu_data(nullptr), "Check failed: data ");
  SyncedMemory impossible(size_t{1} << 62);
  EXPECT_EXIT(impossible.cpu_data(), testing::ExitedWithCode(255), "Unable to allocate memory\n");
}

TEST(BlobTest, DataAndDiffReadZerosAndAllocateOnlyWhenTouched) {
  Blob<float> blob(2, 3, 4, 5);
  EXPECT_EQ(blob.data()->size(), 120 * sizeof(float));
  EXPECT_EQ(Values(blob), std::vector<float>(120, 0.0f));
  EXPECT_EQ(blob.diff()->head(), SyncedMemory::UNINITIALIZED) << "touching data leaves diff alone";
  EXPECT_EQ(blob.cpu_diff()[119], 0.0f);
  Blob<unsigned char> shadow(1, 3, 384, 384);
  EXPECT_EQ(shadow.data()->size(), 3u * 384 * 384);
  EXPECT_EQ(shadow.data()->head(), SyncedMemory::UNINITIALIZED);

  // A zero dimension leaves no memory, but the shape stays readable.
  Blob<float> empty(3, 0, 4, 5);
  EXPECT_EQ(Shape(empty), (std::vector<int>{3, 0, 4, 5}));
  EXPECT_EQ(empty.count(), 0);
  EXPECT_DEATH(empty.cpu_data(), "Check failed: data_ ");
  EXPECT_DEATH(empty.mutable_cpu_diff(), "Check failed: diff_ ");
}

TEST(BlobTest, ReshapeGivesFreshMemoryWhileSharersKeepTheOld) {
  Blob<float> blob(1, 1, 2, 2);
  blob.mutable_cpu_data()[3] = 9.0f;
  Blob<float> sharer(2, 2, 1, 1);
  sharer.ShareData(blob);
  sharer.ShareDiff(blob);
  blob.mutable_cpu_diff()[2] = 3.0f;
  EXPECT_EQ(sharer.cpu_diff()[2], 3.0f);
  blob.Reshape(1, 1, 2, 2);
  EXPECT_EQ(blob.cpu_data()[3], 0.0f);
  EXPECT_EQ(sharer.cpu_data()[3], 9.0f);

  Blob<float> three(1, 1, 1, 3);
  EXPECT_DEATH(blob.ShareData(three), "Check failed: count_ == other.count\\(\\) ");
  EXPECT_DEATH(blob.ShareDiff(three), "Check failed: count_ == other.count\\(\\) ");
  EXPECT_DEATH(blob.set_cpu_data(nullptr), "Check failed: data ");
  EXPECT_DEATH(blob.Reshape(-1, 1, 1, 1), "Check failed: num >= 0 ");
  EXPECT_DEATH(blob.Reshape(1, -1, 1, 1), "Check failed: channels >= 0 ");
  EXPECT_DEATH(blob.Reshape(1, 1, -1, 1), "Check failed: height >= 0 ");
  EXPECT_DEATH(blob.Reshape(1, 1, 1, -1), "Check failed: width >= 0 ");
}

TEST(BlobTest, ShapeRewriteKeepsTheBufferAndFindsOldBytesWhenRegrown) {
  Blob<float> blob(1, 2, 4, 4);
  SetValues(&blob, Ramp(32));
  blob.RewriteShape(1, 2, 2, 3);
  EXPECT_EQ(blob.count(), 12);
  EXPECT_EQ(blob.data()->size(), 32 * sizeof(float));
  // Element (0, 1, 0, 0) of the new shape is element 6 of the old buffer.
  EXPECT_EQ(blob.cpu_data()[blob.offset(0, 1)], 6.0f);
  blob.RewriteShape(1, 2, 4, 4);
  EXPECT_EQ(blob.cpu_data()[31], 31.0f);
}

TEST(BlobTest, OffsetChecksBothEndsOfNButOnlyTheUpperEndOfTheOthers) {
  Blob<float> blob(2, 3, 4, 5);
  EXPECT_EQ(blob.offset(1, 2, 3, 4), 119);
  EXPECT_EQ(blob.offset(2), 120) << "one image past the end passes";
  EXPECT_EQ(blob.offset(0, 3, 4, 5), 3 * 20 + 4 * 5 + 5);
  EXPECT_EQ(blob.offset(1, -1), 60 - 20) << "c is not checked from below";
  EXPECT_EQ(blob.offset(0, 0, -1, -1), -6);
  EXPECT_DEATH(blob.offset(-1), "Check failed: n >= 0 ");
  EXPECT_DEATH(blob.offset(3), "Check failed: n <= num_ ");
  EXPECT_DEATH(blob.offset(0, 4), "Check failed: c <= channels_ ");
  EXPECT_DEATH(blob.offset(0, 0, 5), "Check failed: h <= height_ ");
  EXPECT_DEATH(blob.offset(0, 0, 0, 6), "Check failed: w <= width_ ");
  // The lower checks look at the dimension itself.
  blob.RewriteShape(2, -1, 4, 5);
  EXPECT_DEATH(blob.offset(0), "Check failed: channels_ >= 0 ");
  blob.RewriteShape(2, 3, -1, 5);
  EXPECT_DEATH(blob.offset(0), "Check failed: height_ >= 0 ");
  blob.RewriteShape(2, 3, 4, -1);
  EXPECT_DEATH(blob.offset(0), "Check failed: width_ >= 0 ");
}

TEST(BlobTest, ProtoRoundTripCarriesShapeDataAndDiffOnRequest) {
  Blob<float> source(1, 2, 1, 3);
  SetValues(&source, Ramp(6));
  std::fill(source.mutable_cpu_diff(), source.mutable_cpu_diff() + 6, -1.0f);
  BlobProto without_diff;
  source.ToProto(&without_diff);
  BlobProto with_diff;
  with_diff.add_data(42.0f);  // stale values are replaced, not appended to
  source.ToProto(&with_diff, true);
  Blob<float> copy;
  copy.FromProto(with_diff);
  EXPECT_EQ(Shape(copy), (std::vector<int>{1, 2, 1, 3}));
  EXPECT_EQ(Values(copy), Values(source));
  EXPECT_EQ(std::vector<float>(copy.cpu_diff(), copy.cpu_diff() + 6), std::vector<float>(6, -1));
  copy.FromProto(without_diff);
  EXPECT_EQ(copy.diff()->head(), SyncedMemory::UNINITIALIZED);
  EXPECT_DEATH(copy.FromProto(BlobProto()), "Check failed: data_ ");
}

TEST(EngineTest, SeedFollowsTheProcessAndClockFormula) {
  EXPECT_EQ(Engine::SeedFor(100, 1000), 66237);
  // A process number below 83 makes the product negative: the absolute value.
  EXPECT_EQ(Engine::SeedFor(1, 1700000000), 59509);
  // The product wraps around in 64 bits before the remainder.
  EXPECT_EQ(Engine::SeedFor(4194304, int64_t{1} << 50), 81968);
}

TEST(EngineDeathTest, StartsInCpuModeAndTrainingPhase) {
  // A fresh process, so that no other test has set the singleton before.
  EXPECT_EXIT(std::exit(Engine::mode() == Engine::CPU && Engine::phase() == Engine::TRAIN ? 0 : 1),
              testing::ExitedWithCode(0), "");
}

void Fill(const std::string& text, Blob<float>* blob) {
  std::unique_ptr<Filler<float>>(GetFiller<float>(Parse<FillerParameter>(text)))->Fill(blob);
}

// The lowest and the highest value of a blob filled as `text` says.
std::pair<float, float> FilledRange(const std::string& text, Blob<float>* blob) {
  Fill(text, blob);
  const auto range = std::minmax_element(blob->cpu_data(), blob->cpu_data() + blob->count());
  return {*range.first, *range.second};
}

TEST(FillerTest, EachTypeFillsWithinItsLaw) {
  using Range = std::pair<float, float>;
  Blob<float> blob(2, 3, 4, 5);
  EXPECT_EQ(FilledRange("value: 2.5", &blob), Range(2.5f, 2.5f));
  const Range uniform = FilledRange("type: 'uniform' min: -3 max: -2", &blob);
  EXPECT_TRUE(uniform.first >= -3 && uniform.second <= -2);
  // Xavier bounds: sqrt(3 / fan_in), fan_in = 60 per num, and 1 for a column.
  const Range xavier = FilledRange("type: 'xavier'", &blob);
  EXPECT_TRUE(xavier.first >= -std::sqrt(0.05f) && xavier.second <= std::sqrt(0.05f));
  Blob<float> column(6, 1, 1, 1);
  const Range wide = FilledRange("type: 'xavier'", &column);
  EXPECT_TRUE(wide.first >= -std::sqrt(3.0f) && wide.second <= std::sqrt(3.0f));
  // The default sparsity -1 means no mask and no shape demand.
  EXPECT_NEAR(FilledRange("type: 'gaussian' mean: 10 std: 0.1", &blob).first, 10.0f, 1.0f);
  EXPECT_GT(FilledRange("type: 'positive_unitball'", &blob).first, 0.0f);
  for (int n = 0; n < 2; ++n) {
    EXPECT_NEAR(std::accumulate(blob.cpu_data() + n * 60, blob.cpu_data() + n * 60 + 60, 0.0f),
                1.0f, 1e-5);
  }
  // Sparse Gaussian masks a matrix: sparse / height is the chance of a weight.
  Blob<float> matrix(1, 1, 50, 8);
  EXPECT_EQ(FilledRange("type: 'gaussian' sparse: 0", &matrix), Range(0, 0));
  Fill("type: 'gaussian' mean: 5 sparse: 50", &matrix);
  EXPECT_EQ(std::count(matrix.cpu_data(), matrix.cpu_data() + matrix.count(), 0.0f), 0);
}

TEST(FillerDeathTest, BadParametersEndTheProcessWithTheirWords) {
  Blob<float> blob(2, 1, 2, 2);
  EXPECT_DEATH(Fill("type: 'Gaussian'", &blob),
               "Check failed: false Unknown filler name: Gaussian");
  EXPECT_DEATH(Fill("sparse: 3", &blob),
               "this->filler_param_.sparse\\(\\) == -1 .*Sparsity not supported by this Filler.");
  EXPECT_DEATH(Fill("type: 'xavier' sparse: 3", &blob), "Sparsity not supported by this Filler.");
  EXPECT_DEATH(Fill("type: 'gaussian' sparse: -2", &blob), "Check failed: sparse >= -1 ");
  EXPECT_DEATH(Fill("type: 'gaussian' sparse: 1", &blob), "Check failed: blob->num\\(\\) == 1 ");
  // An empty blob: the data pointer is asked first by some, the count by others.
  Blob<float> empty(0, 1, 1, 1);
  EXPECT_DEATH(Fill("", &empty), "Check failed: data_ ");
  EXPECT_DEATH(Fill("type: 'uniform'", &empty), "Check failed: blob->count\\(\\) ");
  EXPECT_DEATH(Fill("type: 'xavier'", &empty), "Check failed: blob->count\\(\\) ");
}

TEST(MathFunctionsTest, SignAndIndexOfLargestMagnitude) {
  const std::vector<float> x = {-2.0f, 0.0f, 3.0f, std::numeric_limits<float>::quiet_NaN(), -0.0f};
  std::vector<float> sign(5);
  nn_cpu_sign(5, x.data(), sign.data());
  EXPECT_EQ(sign, (std::vector<float>{-1, 0, 1, 0, 0}));
  const std::vector<float> tie = {0.1f, -0.5f, 0.2f, 0.5f};
  EXPECT_EQ(cblas_isamax(4, tie.data(), 1), 1u) << "the lowest index wins a tie";
  EXPECT_EQ(cblas_isamax(0, tie.data(), 1), 0u);
}

TEST(MathFunctionsTest, DegenerateRandomDrawsStayInTheirRanges) {
  std::vector<float> r(1000);
  nn_rng_uniform(1000, 1.0f, 1.0f, r.data());
  for (float v : r) {
    ASSERT_TRUE(v == 1.0f || v == std::nextafter(1.0f, 2.0f)) << v;
  }
  std::vector<int> bits(500, 7);
  nn_rng_bernoulli(500, 1.0, bits.data());
  EXPECT_EQ(bits, std::vector<int>(500, 1));
  nn_rng_bernoulli(500, 0.0f, bits.data());
  EXPECT_EQ(bits, std::vector<int>(500, 0));
}

TEST(MathFunctionsDeathTest, RandomDrawsAndSignCheckTheirArguments) {
  std::vector<float> r(4);
  std::vector<int> bits(4);
  EXPECT_DEATH(nn_rng_uniform(-1, 0, 1, r.data()), "Check failed: n >= 0 ");
  EXPECT_DEATH(nn_rng_uniform(4, 0, 1, nullptr), "Check failed: r ");
  EXPECT_DEATH(nn_rng_uniform(4, 2, 1, r.data()), "Check failed: a <= b ");
  EXPECT_DEATH(nn_rng_gaussian(4, 0, 0, r.data()), "Check failed: sigma > 0 ");
  EXPECT_DEATH(nn_rng_gaussian(4, 0, std::nanf(""), r.data()), "Check failed: sigma > 0 ");
  EXPECT_DEATH(nn_rng_bernoulli(4, -0.5, bits.data()), "Check failed: p >= 0 ");
  EXPECT_DEATH(nn_rng_bernoulli(4, 1.5f, bits.data()), "Check failed: p <= 1 ");
  EXPECT_DEATH(nn_cpu_sign(0, r.data(), r.data()), "Check failed: n > 0 ");
  EXPECT_DEATH(nn_cpu_sign(4, nullptr, r.data()), "Check failed: x ");
}

}  // namespace
}  // namespace nn
