#include "mp/pca_map.h"

namespace mp {

pca_map& pca_map::operator=(const pca_map& other) {
  if (this != &other) {
    mean = other.mean;
    projection = other.projection;
  }
  return *this;
}

const char* pca_map::type_name() const { return "pca_map_mp"; }

bool pca_map::write(std::ostream& stream) const {
  mean.write(stream);
  projection.write(stream);
  return true;
}

bool pca_map::read(std::istream& stream, size_t limit) {
  // Neither result stops the other read.
  mean.read(stream, limit);
  projection.read(stream, limit);
  return true;
}

void pca_map::print(std::ostream& stream) const {
  stream << "[mean] ";
  mean.print(stream);
  stream << "[projection] ";
  projection.print(stream);
}

bool pca_map::is_valid() const { return mean.is_valid() && projection.is_valid(); }

}  // namespace mp
