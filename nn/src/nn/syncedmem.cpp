#include "nn/syncedmem.h"

#include <glog/logging.h>

#include <cstdlib>
#include <cstring>
#include <iostream>

namespace nn {

SyncedMemory::SyncedMemory(size_t size) : size_(size) {}

SyncedMemory::~SyncedMemory() {
  if (cpu_ptr_ && own_cpu_data_) {
    std::free(cpu_ptr_);
  }
}

void SyncedMemory::to_cpu() {
  switch (head_) {
    case UNINITIALIZED:
      cpu_ptr_ = std::malloc(size_);
      if (cpu_ptr_ == nullptr) {
        std::clog << "Unable to allocate memory\n";
        std::exit(-1);
      }
      // Layers may read an activation nobody wrote yet; it must read as zeros.
      std::memset(cpu_ptr_, 0, size_);
      head_ = HEAD_AT_CPU;
      own_cpu_data_ = true;
      break;
    case HEAD_AT_GPU:
      // No operation moves the head to the device; kept for the state table.
      if (cpu_ptr_ == nullptr) {
        cpu_ptr_ = std::malloc(size_);
        own_cpu_data_ = true;
      }
      break;
    case HEAD_AT_CPU:
      break;
  }
}

const void* SyncedMemory::cpu_data() {
  to_cpu();
  return cpu_ptr_;
}

void* SyncedMemory::mutable_cpu_data() {
  to_cpu();
  head_ = HEAD_AT_CPU;
  return cpu_ptr_;
}

void SyncedMemory::set_cpu_data(void* data) {
  CHECK(data);
  if (own_cpu_data_) {
    std::free(cpu_ptr_);
  }
  cpu_ptr_ = data;
  head_ = HEAD_AT_CPU;
  own_cpu_data_ = false;
}

}  // namespace nn
