#ifndef TAVI_SRC_MP_MATRIX_H_
#define TAVI_SRC_MP_MATRIX_H_

#include <cstddef>
#include <cstdint>
#include <istream>
#include <ostream>

#include "mp/io_able.h"

namespace mp {

// A dense row-major float matrix that owns its elements: the element at row r
// and column k is data()[r * columns() + k]. Elements come from malloc and go
// back through free, with no alignment promise. An empty matrix has null data;
// it may still carry a non-zero dimension (a record of 0 rows by 7 columns
// reads back as such).
//
// Binary record, little-endian, no tag and no padding: rows and columns as
// signed 64-bit integers, then rows * columns single-precision floats.
class matrix : public io_able {
 public:
  // Null data, 0 by 0.
  matrix();
  // A zero-filled row of 1 by n; n 0 or below gives null data.
  explicit matrix(int n);
  // A zero-filled matrix of rows by columns; a product of 0 or below gives
  // null data with those dimensions.
  matrix(int rows, int columns);
  // Deep copies: a fresh block and a memcpy of the elements.
  matrix(const matrix& other);
  matrix& operator=(const matrix& other);
  matrix(matrix&& other) noexcept;
  matrix& operator=(matrix&& other) noexcept;
  ~matrix();

  // "matrix_mp".
  const char* type_name() const override;
  // Writes rows and columns widened to 64 bits, then, if the product of the two
  // taken in 32 bits is at least 1, the elements in one stream write. Returns
  // true whatever the stream's state.
  bool write(std::ostream& stream) const override;
  // Reads one record. A record with no elements (a zero product) stores its
  // dimensions, frees the data and returns true. Otherwise, if limit is not 0
  // and limit < 4 * product + 8 (unsigned), returns false with the object
  // unchanged; else reads the elements in one stream read and returns true.
  // Read errors are not tested: they are left on the stream, and elements that
  // could not be read are 0.
  bool read(std::istream& stream, size_t limit) override;
  // Writes the header line "[rows,columns]" to the process's standard output
  // (not to stream), then each row's elements, each followed by a blank, and an
  // end of line, to stream.
  void print(std::ostream& stream) const override;
  // True when data is not null.
  bool is_valid() const override;
  // Reads a record's header and seeks past its elements without loading them;
  // the matrix is not touched. Returns the state of the stream after the last
  // operation.
  virtual bool skip(std::istream& stream) const;

  // Sets every element to value.
  void fill(float value);

  float* data() { return data_; }
  const float* data() const { return data_; }
  int rows() const { return rows_; }
  int columns() const { return columns_; }
  // rows * columns in 64 bits; the number of elements when data is not null.
  int64_t size() const { return static_cast<int64_t>(rows_) * columns_; }

 private:
  void release();

  float* data_;
  int32_t rows_;
  int32_t columns_;
};

}  // namespace mp

#endif  // TAVI_SRC_MP_MATRIX_H_
