#include "mp/io_able.h"

#include <gtest/gtest.h>

#include <cstddef>
#include <cstring>

#include "mp/matrix.h"
#include "mp/pca_map.h"

namespace mp {
namespace {

#if defined(__GNUC__) && defined(__x86_64__)
// Under the Itanium C++ ABI a pointer to a virtual member function holds
// 1 + the byte offset of its slot in the virtual table.
template <typename F>
ptrdiff_t Slot(F f) {
  ptrdiff_t raw;
  static_assert(sizeof(f) >= sizeof(raw), "pointer to member function");
  std::memcpy(&raw, &f, sizeof raw);
  return (raw - 1) / static_cast<ptrdiff_t>(sizeof(void*));
}

TEST(IoAbleTest, VirtualOperationsStandInTheirSlotOrder) {
  EXPECT_EQ(Slot(&io_able::type_name), 0);
  EXPECT_EQ(Slot(&io_able::write), 1);
  EXPECT_EQ(Slot(&io_able::read), 2);
  EXPECT_EQ(Slot(&io_able::print), 3);
  EXPECT_EQ(Slot(&io_able::hook_a), 4);
  EXPECT_EQ(Slot(&io_able::hook_b), 5);
  EXPECT_EQ(Slot(&io_able::hook_c), 6);
  EXPECT_EQ(Slot(&io_able::is_valid), 7);
  EXPECT_EQ(Slot(&matrix::skip), 8);
  EXPECT_EQ(Slot(&pca_map::is_valid), 7);
}
#endif

TEST(IoAbleTest, BothRecordsServeThroughTheInterface) {
  matrix m(2);
  pca_map map;
  const io_able* records[] = {&m, &map};
  EXPECT_STREQ(records[0]->type_name(), "matrix_mp");
  EXPECT_STREQ(records[1]->type_name(), "pca_map_mp");
  EXPECT_TRUE(records[0]->is_valid());
  EXPECT_FALSE(records[1]->is_valid());
}

}  // namespace
}  // namespace mp
