#ifndef NN_SYNCEDMEM_H_
#define NN_SYNCEDMEM_H_

#include <cstddef>

namespace nn {

// The buffer under a blob's data or gradient array. Nothing is allocated until
// the first pointer request, so a net declared for its largest input costs no
// memory for what it never touches. The buffer is zero-filled once, at that
// first touch. The device pointer and the GPU head are kept for layout only:
// the engine runs on the CPU.
//
// Not thread-safe; a memory belongs to one net, and a net to one thread.
class SyncedMemory {
 public:
  enum SyncedHead { UNINITIALIZED = 0, HEAD_AT_CPU = 1, HEAD_AT_GPU = 2 };

  explicit SyncedMemory(size_t size);
  ~SyncedMemory();
  SyncedMemory(const SyncedMemory&) = delete;
  SyncedMemory& operator=(const SyncedMemory&) = delete;

  const void* cpu_data();
  void* mutable_cpu_data();
  // Adopts a buffer that this object will not free.
  void set_cpu_data(void* data);

  size_t size() const { return size_; }
  SyncedHead head() const { return head_; }

 private:
  void to_cpu();

  void* cpu_ptr_ = nullptr;
  void* gpu_ptr_ = nullptr;
  size_t size_;
  SyncedHead head_ = UNINITIALIZED;
  bool own_cpu_data_ = false;
};

}  // namespace nn

#endif  // NN_SYNCEDMEM_H_
