#include "nn/syncedmem.h"

#include <gtest/gtest.h>

#include <vector>

namespace nn {
namespace {

TEST(SyncedMemoryTest, AllocatesZeroedBufferAtFirstTouchOnly) {
  SyncedMemory memory(64);
  EXPECT_EQ(memory.head(), SyncedMemory::UNINITIALIZED);
  EXPECT_EQ(memory.size(), 64u);

  const auto* bytes = static_cast<const unsigned char*>(memory.cpu_data());
  EXPECT_EQ(memory.head(), SyncedMemory::HEAD_AT_CPU);
  for (int i = 0; i < 64; ++i) {
    ASSERT_EQ(bytes[i], 0) << i;
  }

  auto* writable = static_cast<unsigned char*>(memory.mutable_cpu_data());
  EXPECT_EQ(writable, bytes) << "a second touch must not reallocate";
  writable[5] = 7;
  EXPECT_EQ(static_cast<const unsigned char*>(memory.cpu_data())[5], 7) << "zero fill runs once";
}

TEST(SyncedMemoryTest, AdoptedBufferIsUsedButNotOwned) {
  std::vector<float> foreign(4, 2.5f);
  {
    SyncedMemory memory(foreign.size() * sizeof(float));
    memory.mutable_cpu_data();  // owned buffer, freed by set_cpu_data
    memory.set_cpu_data(foreign.data());
    EXPECT_EQ(memory.cpu_data(), foreign.data());
    EXPECT_EQ(static_cast<const float*>(memory.cpu_data())[3], 2.5f) << "no zero fill on adoption";
  }
  foreign[0] = 1.0f;  // still ours after the memory object is gone
  EXPECT_EQ(foreign[0], 1.0f);
}

TEST(SyncedMemoryDeathTest, FailuresEndTheProcessWithTheirWords) {
  SyncedMemory memory(16);
  EXPECT_DEATH(memory.set_cpu_data(nullptr), "Check failed: data ");
  SyncedMemory impossible(size_t{1} << 62);
  EXPECT_EXIT(impossible.cpu_data(), testing::ExitedWithCode(255), "Unable to allocate memory\n");
}

}  // namespace
}  // namespace nn
