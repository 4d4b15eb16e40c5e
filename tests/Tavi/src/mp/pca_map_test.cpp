#include "mp/pca_map.h"

#include <gtest/gtest.h>

#include <cstring>
#include <sstream>
#include <string>

namespace mp {
namespace {

pca_map Map(int d, int k) {
  pca_map map;
  map.mean = matrix(1, d);
  map.projection = matrix(d, k);
  for (int i = 0; i < d; ++i) map.mean.data()[i] = static_cast<float>(i) + 0.5f;
  for (int i = 0; i < d * k; ++i) map.projection.data()[i] = static_cast<float>(i) * -0.25f;
  return map;
}

bool SameMatrix(const matrix& a, const matrix& b) {
  if (a.rows() != b.rows() || a.columns() != b.columns()) return false;
  if (a.data() == nullptr || b.data() == nullptr) return a.data() == b.data();
  return std::memcmp(a.data(), b.data(), static_cast<size_t>(a.size()) * sizeof(float)) == 0;
}

TEST(PcaMapTest, TypeNameAndHooks) {
  const pca_map map;
  EXPECT_STREQ(map.type_name(), "pca_map_mp");
  EXPECT_TRUE(map.hook_a());
  EXPECT_TRUE(map.hook_b());
  EXPECT_TRUE(map.hook_c());
  EXPECT_FALSE(map.is_valid());
}

TEST(PcaMapTest, RecordIsMeanThenProjection) {
  const pca_map map = Map(3, 2);
  std::ostringstream out;
  EXPECT_TRUE(map.write(out));
  std::ostringstream expected;
  map.mean.write(expected);
  map.projection.write(expected);
  EXPECT_EQ(out.str(), expected.str());
  EXPECT_EQ(out.str().size(), 16u + 12u + 16u + 24u);
}

TEST(PcaMapTest, RoundTrip) {
  const pca_map map = Map(4, 3);
  std::stringstream stream;
  map.write(stream);
  pca_map back;
  EXPECT_TRUE(back.read(stream, static_cast<size_t>(-1)));
  EXPECT_TRUE(back.is_valid());
  EXPECT_TRUE(SameMatrix(back.mean, map.mean));
  EXPECT_TRUE(SameMatrix(back.projection, map.projection));
}

TEST(PcaMapTest, ReadReturnsTrueEvenWhenAMemberIsRefused) {
  std::stringstream stream;
  Map(4, 3).write(stream);
  pca_map back;
  // The mean's record needs a limit of 24: refused, and the projection then
  // reads from where the mean's header ended.
  EXPECT_TRUE(back.read(stream, 20));
  EXPECT_FALSE(back.mean.is_valid());
  EXPECT_FALSE(back.is_valid());
}

TEST(PcaMapTest, InvalidWhenTheMeanIsEmptyEvenWithAProjection) {
  pca_map map = Map(2, 2);
  map.mean = matrix();
  EXPECT_TRUE(map.projection.is_valid());
  EXPECT_FALSE(map.is_valid());
  pca_map other = Map(2, 2);
  other.projection = matrix(0, 2);
  EXPECT_FALSE(other.is_valid());
}

TEST(PcaMapTest, CopyIsDeepAndSelfCopyDoesNothing) {
  const pca_map original = Map(3, 2);
  pca_map copy(original);
  EXPECT_NE(copy.mean.data(), original.mean.data());
  EXPECT_NE(copy.projection.data(), original.projection.data());
  copy.projection.data()[0] = 42.0f;
  EXPECT_NE(original.projection.data()[0], 42.0f);
  pca_map assigned;
  assigned = original;
  EXPECT_TRUE(SameMatrix(assigned.mean, original.mean));
  EXPECT_TRUE(SameMatrix(assigned.projection, original.projection));
  const float* mean_data = assigned.mean.data();
  pca_map& self = assigned;
  assigned = self;
  EXPECT_EQ(assigned.mean.data(), mean_data);
}

TEST(PcaMapTest, PrintTagsGoToTheStreamAndHeadersToStandardOutput) {
  pca_map map;
  map.mean = matrix(1, 1);
  map.mean.data()[0] = 1.5f;
  map.projection = matrix(1, 2);
  map.projection.data()[0] = 2.0f;
  map.projection.data()[1] = -1.0f;
  std::ostringstream stream;
  testing::internal::CaptureStdout();
  map.print(stream);
  EXPECT_EQ(testing::internal::GetCapturedStdout(), "[1,1]\n[1,2]\n");
  EXPECT_EQ(stream.str(), "[mean] 1.5 \n[projection] 2 -1 \n");
}

}  // namespace
}  // namespace mp
