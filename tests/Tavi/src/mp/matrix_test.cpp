#include "mp/matrix.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cstdint>
#include <cstring>
#include <limits>
#include <sstream>
#include <string>

namespace mp {
namespace {

std::string Int64Bytes(int64_t value) {
  return std::string(reinterpret_cast<const char*>(&value), sizeof value);
}

std::string FloatBytes(float value) {
  return std::string(reinterpret_cast<const char*>(&value), sizeof value);
}

std::string Record(int64_t rows, int64_t columns, int floats) {
  std::string record = Int64Bytes(rows) + Int64Bytes(columns);
  for (int i = 0; i < floats; ++i) record += FloatBytes(static_cast<float>(i) + 0.5f);
  return record;
}

matrix Filled(int rows, int columns) {
  matrix m(rows, columns);
  for (int64_t i = 0; i < m.size(); ++i) m.data()[i] = static_cast<float>(i) * 1.25f - 3.0f;
  return m;
}

TEST(MatrixTest, DefaultIsEmpty) {
  const matrix m;
  EXPECT_EQ(m.data(), nullptr);
  EXPECT_EQ(m.rows(), 0);
  EXPECT_EQ(m.columns(), 0);
  EXPECT_FALSE(m.is_valid());
  EXPECT_STREQ(m.type_name(), "matrix_mp");
  EXPECT_TRUE(m.hook_a());
  EXPECT_TRUE(m.hook_b());
  EXPECT_TRUE(m.hook_c());
}

TEST(MatrixTest, RowConstructorIsZeroFilled) {
  const matrix m(5);
  ASSERT_TRUE(m.is_valid());
  EXPECT_EQ(m.rows(), 1);
  EXPECT_EQ(m.columns(), 5);
  for (int i = 0; i < 5; ++i) EXPECT_EQ(m.data()[i], 0.0f);
  EXPECT_FALSE(matrix(0).is_valid());
}

TEST(MatrixTest, WriteGivesTheExactRecord) {
  const matrix m = Filled(2, 3);
  std::ostringstream out;
  EXPECT_TRUE(m.write(out));
  std::string expected = Int64Bytes(2) + Int64Bytes(3);
  for (int i = 0; i < 6; ++i) expected += FloatBytes(m.data()[i]);
  EXPECT_EQ(out.str(), expected);
}

TEST(MatrixTest, WriteAndReadRoundTrip) {
  const matrix m = Filled(4, 7);
  std::stringstream stream;
  m.write(stream);
  matrix back;
  EXPECT_TRUE(back.read(stream, static_cast<size_t>(-1)));
  ASSERT_TRUE(back.is_valid());
  EXPECT_EQ(back.rows(), 4);
  EXPECT_EQ(back.columns(), 7);
  EXPECT_EQ(std::memcmp(back.data(), m.data(), 28 * sizeof(float)), 0);
  EXPECT_TRUE(stream.good());
}

TEST(MatrixTest, ZeroRowsWritesOnlyTheHeaderAndKeepsTheColumns) {
  const matrix m(0, 7);
  EXPECT_FALSE(m.is_valid());
  std::stringstream stream;
  m.write(stream);
  EXPECT_EQ(stream.str(), Int64Bytes(0) + Int64Bytes(7));
  matrix back = Filled(2, 2);
  EXPECT_TRUE(back.read(stream, 0));
  EXPECT_EQ(back.data(), nullptr);
  EXPECT_EQ(back.rows(), 0);
  EXPECT_EQ(back.columns(), 7);
  EXPECT_FALSE(back.is_valid());
}

TEST(MatrixTest, NegativeDimensionsWithAProductOfOneReadOneFloat) {
  std::istringstream stream(Record(-1, -1, 1) + FloatBytes(99.0f));
  matrix m;
  EXPECT_TRUE(m.read(stream, static_cast<size_t>(-1)));
  ASSERT_TRUE(m.is_valid());
  EXPECT_EQ(m.rows(), -1);
  EXPECT_EQ(m.columns(), -1);
  EXPECT_EQ(m.data()[0], 0.5f);
  // The stream stands right after the one float.
  float next = 0;
  stream.read(reinterpret_cast<char*>(&next), sizeof next);
  EXPECT_EQ(next, 99.0f);
}

TEST(MatrixTest, ReadLimitComparesWithFourTimesTheCountPlusEight) {
  const std::string record = Record(1, 1, 1);  // 20 bytes
  {
    std::istringstream stream(record);
    matrix m = Filled(1, 2);
    EXPECT_FALSE(m.read(stream, 8));
    // Unchanged.
    EXPECT_EQ(m.rows(), 1);
    EXPECT_EQ(m.columns(), 2);
    EXPECT_EQ(m.data()[1], Filled(1, 2).data()[1]);
  }
  {
    std::istringstream stream(record);
    matrix m;
    EXPECT_FALSE(m.read(stream, 11));
    EXPECT_FALSE(m.is_valid());
  }
  for (size_t limit : {size_t{12}, size_t{20}, size_t{0}, static_cast<size_t>(-1)}) {
    std::istringstream stream(record);
    matrix m;
    EXPECT_TRUE(m.read(stream, limit)) << limit;
    ASSERT_TRUE(m.is_valid());
    EXPECT_EQ(m.data()[0], 0.5f);
  }
}

TEST(MatrixTest, LimitDoesNotApplyToAnEmptyRecord) {
  std::istringstream stream(Record(0, 5, 0));
  matrix m;
  EXPECT_TRUE(m.read(stream, 1));
  EXPECT_EQ(m.columns(), 5);
}

TEST(MatrixTest, ReadReplacesEarlierContents) {
  std::stringstream stream;
  Filled(2, 2).write(stream);
  matrix m = Filled(3, 5);
  EXPECT_TRUE(m.read(stream, 0));
  EXPECT_EQ(m.rows(), 2);
  EXPECT_EQ(m.columns(), 2);
  EXPECT_EQ(std::memcmp(m.data(), Filled(2, 2).data(), 4 * sizeof(float)), 0);
}

TEST(MatrixTest, ShortRecordLeavesTheStreamFailedAndMissingElementsZero) {
  std::istringstream stream(Record(1, 3, 1));
  matrix m;
  EXPECT_TRUE(m.read(stream, 0));
  EXPECT_TRUE(stream.fail());
  ASSERT_TRUE(m.is_valid());
  EXPECT_EQ(m.data()[0], 0.5f);
  EXPECT_EQ(m.data()[1], 0.0f);
  EXPECT_EQ(m.data()[2], 0.0f);
}

TEST(MatrixTest, HugeRecordRaisesTheAllocationError) {
  std::istringstream stream(Record(std::numeric_limits<int64_t>::max(), 8, 0));
  matrix m;
  EXPECT_THROW(m.read(stream, 0), std::bad_alloc);
  EXPECT_FALSE(m.is_valid());
}

TEST(MatrixTest, SkipMovesPastTheRecordWithoutLoadingIt) {
  std::stringstream stream;
  matrix(0, 9).write(stream);
  Filled(2, 3).write(stream);
  stream << "tail";
  const matrix m = Filled(1, 1);
  EXPECT_TRUE(m.skip(stream));
  EXPECT_EQ(stream.tellg(), 16);
  EXPECT_TRUE(m.skip(stream));
  EXPECT_EQ(stream.tellg(), 16 + 16 + 24);
  std::string tail;
  stream >> tail;
  EXPECT_EQ(tail, "tail");
  EXPECT_EQ(m.rows(), 1);
  EXPECT_EQ(m.data()[0], Filled(1, 1).data()[0]);
}

TEST(MatrixTest, SkipOfAnEmptyStreamFails) {
  std::istringstream stream("");
  EXPECT_FALSE(matrix().skip(stream));
}

TEST(MatrixTest, FillSetsEveryElement) {
  for (int n = 1; n <= 11; ++n) {
    matrix m(1, n);
    m.fill(2.5f);
    for (int i = 0; i < n; ++i) EXPECT_EQ(m.data()[i], 2.5f) << n << " " << i;
  }
  matrix big(13, 17);
  big.fill(-1.0f);
  for (int64_t i = 0; i < big.size(); ++i) ASSERT_EQ(big.data()[i], -1.0f);
  matrix empty;
  empty.fill(1.0f);
  EXPECT_FALSE(empty.is_valid());
}

TEST(MatrixTest, CopiesAreDeep) {
  const matrix original = Filled(2, 3);
  matrix copy(original);
  ASSERT_NE(copy.data(), original.data());
  copy.data()[0] = 100.0f;
  EXPECT_NE(original.data()[0], 100.0f);
  matrix assigned;
  assigned = original;
  EXPECT_EQ(assigned.rows(), 2);
  EXPECT_EQ(std::memcmp(assigned.data(), original.data(), 6 * sizeof(float)), 0);
  matrix& self = assigned;
  assigned = self;
  EXPECT_EQ(assigned.data()[5], original.data()[5]);
}

TEST(MatrixTest, PrintSendsTheHeaderToStandardOutputAndTheRowsToTheStream) {
  matrix m(2, 2);
  m.data()[0] = 1.0f;
  m.data()[1] = 2.5f;
  m.data()[2] = -3.0f;
  m.data()[3] = 0.25f;
  std::ostringstream stream;
  testing::internal::CaptureStdout();
  m.print(stream);
  const std::string standard_output = testing::internal::GetCapturedStdout();
  EXPECT_EQ(standard_output, "[2,2]\n");
  EXPECT_EQ(stream.str(), "1 2.5 \n-3 0.25 \n");
}

}  // namespace
}  // namespace mp
