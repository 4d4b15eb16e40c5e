#include "nn/blob.h"

#include <gtest/gtest.h>

#include <vector>

#include "gradient_checker.h"
#include "nn/syncedmem.h"

namespace nn {
namespace {

TEST(SyncedMemoryTest, ZeroedBufferAtFirstTouchOnlyAndAdoptedBuffersAreNotOwned) {
  SyncedMemory memory(64);
  EXPECT_EQ(memory.head(), SyncedMemory::UNINITIALIZED);
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
  EXPECT_EQ(blob.count(), 120);
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
  const float* data = blob.cpu_data();
  blob.RewriteShape(1, 2, 2, 3);
  EXPECT_EQ(blob.count(), 12);
  EXPECT_EQ(blob.data()->size(), 32 * sizeof(float));
  EXPECT_EQ(blob.cpu_data(), data);
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
  EXPECT_EQ(without_diff.diff_size(), 0);
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

}  // namespace
}  // namespace nn
