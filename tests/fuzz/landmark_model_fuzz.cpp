// Landmark model files: whatever the bytes, the check and the load answer
// with a status, and a model that loads aligns a face inside its arrays.
#include <cstddef>
#include <cstdint>
#include <fstream>
#include <string>
#include <vector>

#include "tavilib.h"
#include "temp_dir.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  static const TempDir dir;
  std::ofstream(dir.path() + "/model.sdm", std::ios::binary | std::ios::trunc)
      .write(reinterpret_cast<const char*>(data), static_cast<std::streamsize>(size));
  std::string message;
  tavilib::checkSDMModel(dir.path(), "model.sdm", message);
  if (tavilib::loadSDMModel(dir.path(), "model.sdm") == tavilib::STATUS_OK) {
    std::vector<unsigned char> pixels(120 * 100 * 3);
    for (size_t i = 0; i < pixels.size(); ++i) pixels[i] = static_cast<unsigned char>(i * 7);
    std::vector<float> points;
    tavilib::align68Points(tavilib::Image{120, 100, 0, pixels.data()},
                           tavilib::Rectangle<float>{30, 20, 90, 80}, points);
  }
  tavilib::unloadSDMModel();
  return 0;
}
