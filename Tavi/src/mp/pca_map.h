#ifndef TAVI_SRC_MP_PCA_MAP_H_
#define TAVI_SRC_MP_PCA_MAP_H_

#include <cstddef>
#include <istream>
#include <ostream>

#include "mp/io_able.h"
#include "mp/matrix.h"

namespace mp {

// A linear map with a mean: y = (x - mean) * projection, for a row x of D
// floats, mean of 1 by D and projection of D by K.
//
// Binary record: the record of mean followed directly by that of projection.
class pca_map : public io_able {
 public:
  pca_map() = default;
  // Deep copies of both members; a self-copy does nothing.
  pca_map(const pca_map& other) = default;
  pca_map& operator=(const pca_map& other);
  pca_map(pca_map&& other) noexcept = default;
  pca_map& operator=(pca_map&& other) noexcept = default;
  ~pca_map() = default;

  // "pca_map_mp".
  const char* type_name() const override;
  // mean.write, then projection.write; returns true.
  bool write(std::ostream& stream) const override;
  // mean.read, then projection.read, each with limit; their results are
  // ignored and this returns true.
  bool read(std::istream& stream, size_t limit) override;
  // "[mean] ", the mean's text, "[projection] ", the projection's text; the
  // header lines of the two matrices go to standard output (see matrix::print).
  void print(std::ostream& stream) const override;
  // Both members valid; projection is not asked when mean is not.
  bool is_valid() const override;

  matrix mean;
  matrix projection;
};

}  // namespace mp

#endif  // TAVI_SRC_MP_PCA_MAP_H_
