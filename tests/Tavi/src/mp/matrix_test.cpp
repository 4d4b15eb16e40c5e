#include "mp/matrix.h"

#include <gtest/gtest.h>

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <limits>
#include <new>
#include <sstream>
#include <string>

namespace mp {
namespace {

std::string Int64Bytes(int64_t value) { return std::string(reinterpret_cast<const char*>(&value), 8); }
std::string FloatBytes(float value) { return std::string(reinterpret_cast<const char*>(&value), 4); }

// A record header and floats 0.5, 1.5, ...
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

TEST(MatrixTest, WriteGivesTheExactRecordAndReadReplacesTheContents) {
  const matrix m = Filled(2, 3);
  std::stringstream stream;
  EXPECT_TRUE(m.write(stream));
  std::string expected = Int64Bytes(2) + Int64Bytes(3);
  for (int i = 0; i < 6; ++i) expected += FloatBytes(m.data()[i]);
  EXPECT_EQ(stream.str(), expected);
  matrix back = Filled(3, 5);
  EXPECT_TRUE(back.read(stream, static_cast<size_t>(-1)));
  EXPECT_EQ(back.rows(), 2);
  EXPECT_EQ(back.columns(), 3);
  EXPECT_EQ(std::memcmp(back.data(), m.data(), 6 * sizeof(float)), 0);
}

TEST(MatrixTest, RecordsWithoutElementsOrWithNegativeDimensions) {
  // 0 rows by 7 columns: the header only; it reads back with its columns and
  // no data, whatever the limit.
  std::stringstream stream;
  matrix(0, 7).write(stream);
  EXPECT_EQ(stream.str(), Int64Bytes(0) + Int64Bytes(7));
  matrix back = Filled(2, 2);
  EXPECT_TRUE(back.read(stream, 1));
  EXPECT_EQ(back.data(), nullptr);
  EXPECT_EQ(back.rows(), 0);
  EXPECT_EQ(back.columns(), 7);
  // -1 by -1 has a product of 1: one float is read, and no more.
  std::istringstream negative(Record(-1, -1, 1) + FloatBytes(99.0f));
  EXPECT_TRUE(back.read(negative, 0));
  EXPECT_EQ(back.rows(), -1);
  ASSERT_TRUE(back.is_valid());
  EXPECT_EQ(back.data()[0], 0.5f);
  float next = 0;
  negative.read(reinterpret_cast<char*>(&next), 4);
  EXPECT_EQ(next, 99.0f);
}

TEST(MatrixTest, ReadLimitComparesWithFourTimesTheCountPlusEight) {
  const std::string record = Record(1, 1, 1);  // 20 bytes
  for (size_t limit : {size_t{8}, size_t{11}, size_t{12}, size_t{20}, size_t{0}, static_cast<size_t>(-1)}) {
    std::istringstream stream(record);
    matrix m = Filled(1, 2);
    const bool accepted = limit == 0 || limit >= 12;
    EXPECT_EQ(m.read(stream, limit), accepted) << limit;
    // A refused record leaves the matrix as it was.
    EXPECT_EQ(m.columns(), accepted ? 1 : 2) << limit;
    EXPECT_EQ(m.data()[0], accepted ? 0.5f : Filled(1, 2).data()[0]) << limit;
  }
}

TEST(MatrixTest, HugeRecordRaisesTheAllocationError) {
  // The byte count overflows: the largest size is asked for, and refused.
  std::istringstream huge(Record(std::numeric_limits<int64_t>::max(), 8, 0));
  matrix m;
  EXPECT_THROW(m.read(huge, 0), std::bad_alloc);
  EXPECT_FALSE(m.is_valid());
}

TEST(MatrixTest, SkipMovesPastTheRecordWithoutLoadingIt) {
  std::stringstream stream;
  matrix(0, 9).write(stream);
  Filled(2, 3).write(stream);
  const matrix m;
  EXPECT_TRUE(m.skip(stream));
  EXPECT_EQ(stream.tellg(), 16);
  EXPECT_TRUE(m.skip(stream));
  EXPECT_EQ(stream.tellg(), 16 + 16 + 24);
  EXPECT_FALSE(m.skip(stream));  // nothing left
}

TEST(MatrixTest, FillSetsEveryElement) {
  for (int n : {1, 3, 4, 5, 7, 8, 11, 13 * 17}) {  // on both sides of the blocks of four
    matrix m(1, n);
    m.fill(2.5f);
    for (int i = 0; i < n; ++i) ASSERT_EQ(m.data()[i], 2.5f) << n << " " << i;
  }
}

#if defined(__GNUC__) && defined(__x86_64__)
// Under the Itanium C++ ABI a pointer to a virtual member function holds 1 +
// the byte offset of its slot. A virtual destructor or a reordered declaration
// in io_able would shift the slots.
TEST(MatrixTest, VirtualOperationsStandInTheirSlotOrder) {
  auto slot = [](auto f) {
    ptrdiff_t raw;
    std::memcpy(&raw, &f, sizeof raw);
    return (raw - 1) / static_cast<ptrdiff_t>(sizeof(void*));
  };
  EXPECT_EQ(slot(&io_able::type_name), 0);
  EXPECT_EQ(slot(&io_able::is_valid), 7);
  EXPECT_EQ(slot(&matrix::skip), 8);
}
#endif

}  // namespace
}  // namespace mp
