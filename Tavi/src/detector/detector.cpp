#include "detector/cascade_loader.h"
#include "detector/detector_state.h"
#include "nn/engine.h"
#include "tavilib.h"

namespace tavilib {

namespace {

// The old state goes first, also when the new load then fails. The new one is
// stored before anything can fail, which is why is_loaded() holds after a
// failed load.
DetectorState* replaceState(DetectorState*& state) {
  delete state;
  state = nullptr;
  nn::Engine::set_mode(nn::Engine::CPU);
  nn::Engine::set_phase(nn::Engine::TEST);
  state = new DetectorState();
  return state;
}

}  // namespace

Detector::Detector() : detector_(nullptr) {}

Detector::~Detector() { delete detector_; }

Detector& Detector::operator=(const Detector& other) {
  detector_ = other.detector_;
  return *this;
}

Status Detector::load() { return loadBuiltInCascade(*replaceState(detector_)); }

Status Detector::load(const DetectorParams& params) {
  return loadCascadeFromFolder(*replaceState(detector_), params);
}

void Detector::unload() {
  delete detector_;
  detector_ = nullptr;
}

bool Detector::is_loaded() const { return detector_ != nullptr; }

const void* Detector::getDetector() const { return detector_; }

Status loadDetector(Detector& detector) { return detector.load(); }

Status loadDetector(Detector& detector, const DetectorParams& params) {
  return detector.load(params);
}

void unloadDetector(Detector& detector) { detector.unload(); }

}  // namespace tavilib
