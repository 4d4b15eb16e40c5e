#include "nn/blob.h"

#include <gtest/gtest.h>

namespace nn {
namespace {

TEST(BlobTest, DataAndDiffReadZerosAtFirstTouchAndAllocateLazily) {
  Blob<float> blob(2, 3, 4, 5);
  EXPECT_EQ(blob.count(), 120);
  EXPECT_EQ(blob.data()->size(), 120 * sizeof(float));
  EXPECT_EQ(blob.data()->head(), SyncedMemory::UNINITIALIZED);
  EXPECT_EQ(blob.diff()->head(), SyncedMemory::UNINITIALIZED);
  for (int i = 0; i < blob.count(); ++i) {
    ASSERT_EQ(blob.cpu_data()[i], 0.0f);
  }
  EXPECT_EQ(blob.diff()->head(), SyncedMemory::UNINITIALIZED) << "touching data leaves diff alone";
  EXPECT_EQ(blob.cpu_diff()[119], 0.0f);

  Blob<unsigned char> shadow(1, 3, 384, 384);
  EXPECT_EQ(shadow.data()->size(), 3u * 384 * 384);
  EXPECT_EQ(shadow.data()->head(), SyncedMemory::UNINITIALIZED);
}

TEST(BlobTest, ReshapeToTheSameShapeGivesFreshMemoryAndSharersKeepTheOld) {
  Blob<float> blob(1, 1, 2, 2);
  blob.mutable_cpu_data()[3] = 9.0f;
  Blob<float> sharer(1, 1, 2, 2);
  sharer.ShareData(blob);

  blob.Reshape(1, 1, 2, 2);
  EXPECT_EQ(blob.cpu_data()[3], 0.0f);
  EXPECT_EQ(sharer.cpu_data()[3], 9.0f);
}

TEST(BlobTest, ShapeRewriteKeepsTheBufferAndFindsOldBytesWhenRegrown) {
  Blob<float> blob(1, 2, 4, 4);
  float* data = blob.mutable_cpu_data();
  for (int i = 0; i < blob.count(); ++i) {
    data[i] = static_cast<float>(i);
  }
  blob.RewriteShape(1, 2, 2, 3);
  EXPECT_EQ(blob.count(), 12);
  EXPECT_EQ(blob.data()->size(), 32 * sizeof(float));
  EXPECT_EQ(blob.cpu_data(), data);
  // Element (0, 1, 0, 0) of the new shape is element 6 of the old buffer.
  EXPECT_EQ(blob.cpu_data()[blob.offset(0, 1)], 6.0f);

  blob.RewriteShape(1, 2, 4, 4);
  EXPECT_EQ(blob.count(), 32);
  for (int i = 0; i < blob.count(); ++i) {
    ASSERT_EQ(blob.cpu_data()[i], static_cast<float>(i));
  }
}

TEST(BlobTest, ZeroDimensionLeavesNoMemoryButShapeAccessorsWork) {
  Blob<float> blob(3, 0, 4, 5);
  EXPECT_EQ(blob.count(), 0);
  EXPECT_EQ(blob.num(), 3);
  EXPECT_EQ(blob.width(), 5);
  EXPECT_DEATH(blob.cpu_data(), "Check failed: data_ ");
  EXPECT_DEATH(blob.mutable_cpu_diff(), "Check failed: diff_ ");
  EXPECT_DEATH(blob.data(), "Check failed: data_ ");
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

TEST(BlobTest, ReshapeAndSharingRefuseBadArguments) {
  Blob<float> blob;
  EXPECT_DEATH(blob.Reshape(-1, 1, 1, 1), "Check failed: num >= 0 ");
  EXPECT_DEATH(blob.Reshape(1, -1, 1, 1), "Check failed: channels >= 0 ");
  EXPECT_DEATH(blob.Reshape(1, 1, -1, 1), "Check failed: height >= 0 ");
  EXPECT_DEATH(blob.Reshape(1, 1, 1, -1), "Check failed: width >= 0 ");

  Blob<float> a(1, 1, 2, 2);
  Blob<float> b(1, 1, 1, 3);
  EXPECT_DEATH(a.ShareData(b), "Check failed: count_ == other.count\\(\\) ");
  EXPECT_DEATH(a.ShareDiff(b), "Check failed: count_ == other.count\\(\\) ");
  EXPECT_DEATH(a.set_cpu_data(nullptr), "Check failed: data ");
}

TEST(BlobTest, ShareDiffSharesGradientsOnly) {
  Blob<float> a(1, 1, 1, 4);
  Blob<float> b(2, 2, 1, 1);
  b.ShareDiff(a);
  a.mutable_cpu_diff()[2] = 3.0f;
  b.mutable_cpu_data()[2] = 5.0f;
  EXPECT_EQ(b.cpu_diff()[2], 3.0f);
  EXPECT_EQ(a.cpu_data()[2], 0.0f);
}

TEST(BlobTest, ProtoRoundTripCarriesShapeDataAndDiffOnRequest) {
  Blob<float> source(1, 2, 1, 3);
  for (int i = 0; i < 6; ++i) {
    source.mutable_cpu_data()[i] = 0.5f * i;
    source.mutable_cpu_diff()[i] = -1.0f * i;
  }
  BlobProto without_diff;
  source.ToProto(&without_diff);
  EXPECT_EQ(without_diff.diff_size(), 0);

  BlobProto with_diff;
  with_diff.add_data(42.0f);  // stale values are replaced, not appended to
  source.ToProto(&with_diff, true);
  ASSERT_EQ(with_diff.data_size(), 6);
  ASSERT_EQ(with_diff.diff_size(), 6);

  Blob<float> copy;
  copy.FromProto(with_diff);
  EXPECT_EQ(copy.num(), 1);
  EXPECT_EQ(copy.channels(), 2);
  EXPECT_EQ(copy.height(), 1);
  EXPECT_EQ(copy.width(), 3);
  for (int i = 0; i < 6; ++i) {
    EXPECT_EQ(copy.cpu_data()[i], 0.5f * i);
    EXPECT_EQ(copy.cpu_diff()[i], -1.0f * i);
  }

  Blob<float> data_only;
  data_only.FromProto(without_diff);
  EXPECT_EQ(data_only.diff()->head(), SyncedMemory::UNINITIALIZED);

  BlobProto empty;
  EXPECT_DEATH(data_only.FromProto(empty), "Check failed: data_ ");
}

}  // namespace
}  // namespace nn
