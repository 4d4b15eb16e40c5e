// A host program built against an installed tavi: it checks and loads the
// installed models, whose folder the build gives as MODEL_DIR, and finds
// faces in a plain grey image (none expected).
#include <tavilib.h>

#include <cstdio>
#include <string>
#include <vector>

int main() {
  const std::string models = MODEL_DIR;
  std::string fault;
  if (tavilib::checkDetectorModel(tavilib::DetectorParams(models.c_str(), "cascade.list"), fault) !=
          tavilib::STATUS_OK ||
      tavilib::checkSDMModel(models, "landmarks.sdm", fault) != tavilib::STATUS_OK) {
    std::fprintf(stderr, "%s\n", fault.c_str());
    return 1;
  }
  tavilib::Detector detector;
  if (detector.load(tavilib::DetectorParams(models.c_str(), "cascade.list")) != tavilib::STATUS_OK) {
    return 1;
  }
  std::vector<unsigned char> pixels(320 * 240 * 3, 128);
  const tavilib::Image image{320, 240, 0, pixels.data()};
  tavilib::ScanSettings scan{};
  std::vector<tavilib::Detection> faces;
  if (tavilib::scanSettingsFor(detector, 320, 240, 40, scan) != tavilib::STATUS_OK ||
      tavilib::detect(image, detector, faces, scan.params) != tavilib::STATUS_OK) {
    return 1;
  }
  std::printf("consumer: %zu faces, minimum face %d\n", faces.size(), scan.minFace);
  return 0;
}
