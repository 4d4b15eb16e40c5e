#include "mp/pca_map.h"

#include <gtest/gtest.h>

#include <sstream>
#include <string>

namespace mp {
namespace {

pca_map Map(int d, int k) {
  pca_map map;
  map.mean = matrix(1, d);
  map.projection = matrix(d, k);
  for (int i = 0; i < d; ++i) map.mean.data()[i] = static_cast<float>(i) + 0.5f;
  for (int i = 0; i < d * k; ++i) map.projection.data()[i] = static_cast<float>(i + 1) * -0.25f;
  return map;
}

std::string Bytes(const io_able& record) {
  std::ostringstream out;
  EXPECT_TRUE(record.write(out));
  return out.str();
}

// The record is the mean's then the projection's. A read whose limit refuses
// the mean (which needs 24) goes on and reports true all the same; the map
// is valid only with both members.
TEST(PcaMapTest, RecordIsMeanThenProjectionAndReadIgnoresARefusal) {
  const pca_map map = Map(4, 3);
  EXPECT_EQ(Bytes(map), Bytes(map.mean) + Bytes(map.projection));
  std::istringstream stream(Bytes(map) + Bytes(map));
  pca_map back;
  EXPECT_TRUE(back.read(stream, static_cast<size_t>(-1)));
  EXPECT_TRUE(back.is_valid());
  EXPECT_EQ(Bytes(back), Bytes(map));
  pca_map refused;
  EXPECT_TRUE(refused.read(stream, 20));
  EXPECT_FALSE(refused.mean.is_valid());
  EXPECT_FALSE(refused.is_valid());
}

// The matrices' header lines go to standard output, whatever the stream.
TEST(PcaMapTest, PrintTagsAndRowsGoToTheStreamAndHeadersToStandardOutput) {
  std::ostringstream stream;
  testing::internal::CaptureStdout();
  Map(2, 1).print(stream);
  EXPECT_EQ(testing::internal::GetCapturedStdout(), "[1,2]\n[2,1]\n");
  EXPECT_EQ(stream.str(), "[mean] 0.5 1.5 \n[projection] -0.25 \n-0.5 \n");
}

}  // namespace
}  // namespace mp
