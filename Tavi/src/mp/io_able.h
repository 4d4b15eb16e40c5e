#ifndef TAVI_SRC_MP_IO_ABLE_H_
#define TAVI_SRC_MP_IO_ABLE_H_

#include <cstddef>
#include <istream>
#include <ostream>

namespace mp {

// The stream interface shared by the records of the alignment model. The
// virtual operations stand in this slot order in every derived class:
// type_name, write, read, print, hook_a, hook_b, hook_c, is_valid (and, in
// mp::matrix only, skip after them).
//
// The destructor is protected and not virtual, so that it takes no slot: the
// records are values, never deleted through this interface.
class io_able {
 public:
  // The record's type name; not part of the binary form.
  virtual const char* type_name() const = 0;
  // Writes the binary record; returns true.
  virtual bool write(std::ostream& stream) const = 0;
  // Replaces the contents by a binary record from stream. limit is the largest
  // record size accepted in bytes, 0 or (size_t)-1 for no limit; what the
  // limit is compared with is told by each record.
  virtual bool read(std::istream& stream, size_t limit) = 0;
  // Text form for people; it has no reader.
  virtual void print(std::ostream& stream) const = 0;
  // Hooks without a set meaning; they return true.
  virtual bool hook_a() const { return true; }
  virtual bool hook_b() const { return true; }
  virtual bool hook_c() const { return true; }
  // True when the record holds data.
  virtual bool is_valid() const = 0;

 protected:
  io_able() = default;
  io_able(const io_able&) = default;
  io_able& operator=(const io_able&) = default;
  ~io_able() = default;
};

}  // namespace mp

#endif  // TAVI_SRC_MP_IO_ABLE_H_
