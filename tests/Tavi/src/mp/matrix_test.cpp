#include "mp/matrix.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <cstring>
#include <sstream>
#include <string>

namespace mp {
namespace {

std::string Int64Bytes(int64_t value) { return std::string(reinterpret_cast<const char*>(&value), 8); }
std::string FloatBytes(float value) { return std::string(reinterpret_cast<const char*>(&value), 4); }

matrix Filled(int rows, int columns) {
  matrix m(rows, columns);
  for (int64_t i = 0; i < m.size(); ++i) m.data()[i] = static_cast<float>(i) * 1.25f - 3.0f;
  return m;
}

// The record of 2 by 3, read back over another matrix; then one of 0 by 7,
// which is its header alone and reads back with its columns and no data;
// skip moves past both without loading them.
TEST(MatrixTest, RecordsWriteReadAndSkipAlsoWithoutElements) {
  std::stringstream stream;
  EXPECT_TRUE(Filled(2, 3).write(stream));
  std::string expected = Int64Bytes(2) + Int64Bytes(3);
  for (int i = 0; i < 6; ++i) expected += FloatBytes(Filled(2, 3).data()[i]);
  matrix(0, 7).write(stream);
  EXPECT_EQ(stream.str(), expected + Int64Bytes(0) + Int64Bytes(7));
  matrix back = Filled(3, 5);
  EXPECT_TRUE(back.read(stream, static_cast<size_t>(-1)));
  EXPECT_EQ(back.rows(), 2);
  EXPECT_EQ(back.columns(), 3);
  EXPECT_EQ(std::memcmp(back.data(), Filled(2, 3).data(), 6 * sizeof(float)), 0);
  EXPECT_TRUE(back.read(stream, 1));
  EXPECT_FALSE(back.is_valid());
  EXPECT_EQ(back.rows(), 0);
  EXPECT_EQ(back.columns(), 7);
  stream.seekg(0);
  EXPECT_TRUE(back.skip(stream));
  EXPECT_EQ(stream.tellg(), 16 + 24);
  EXPECT_TRUE(back.skip(stream));
  EXPECT_EQ(stream.tellg(), 16 + 24 + 16);
  EXPECT_FALSE(back.skip(stream));  // nothing left
}

// The limit is compared with four times the count plus eight (a record of
// one float passes 12, not 11), and 0 switches it off; a refused record
// leaves the matrix as it was.
TEST(MatrixTest, ReadLimitIsFourTimesTheCountPlusEight) {
  const std::string one = Int64Bytes(1) + Int64Bytes(1) + FloatBytes(0.5f);
  for (size_t limit : {size_t{11}, size_t{12}, size_t{0}}) {
    std::istringstream stream(one);
    matrix m = Filled(1, 2);
    EXPECT_EQ(m.read(stream, limit), limit != 11) << limit;
    EXPECT_EQ(m.data()[0], limit != 11 ? 0.5f : -3.0f) << limit;
  }
}

TEST(MatrixTest, FillSetsEveryElement) {
  for (int n : {1, 3, 4, 5, 7, 8, 11, 13 * 17}) {  // on both sides of the blocks of four
    matrix m(1, n);
    m.fill(2.5f);
    for (int i = 0; i < n; ++i) ASSERT_EQ(m.data()[i], 2.5f) << n << " " << i;
  }
}

}  // namespace
}  // namespace mp
