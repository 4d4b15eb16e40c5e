#ifndef TAVI_SRC_DETECTOR_DETECTOR_STATE_H_
#define TAVI_SRC_DETECTOR_DETECTOR_STATE_H_

#include <boost/shared_ptr.hpp>

#include <cstdint>
#include <vector>

namespace nn {
template <typename Dtype>
class Net;
}  // namespace nn

namespace tavilib {

// One class of the calibration net: a shift in pixels of the net's input and
// a size factor.
struct OffsetScale {
  int32_t offsetX;
  int32_t offsetY;
  float scale;
};

// One network of the cascade and what belongs to it.
struct CascadeStage {
  boost::shared_ptr<nn::Net<float>> net;
  // The same net for several windows at once, sharing its weights; made by
  // the grading at first use.
  boost::shared_ptr<nn::Net<float>> batchNet;
  // Calibration classes; empty in all but the calibration stage.
  std::vector<OffsetScale> offsetsScales;
  // Mean image, plane by plane, of the net's input size; empty in the first
  // stage.
  std::vector<float> mean;
  // Windows must score strictly above this to go on.
  float threshold = 0.0f;
};

// Everything a loaded Detector owns.
class DetectorState {
 public:
  // The chain in running order.
  std::vector<CascadeStage> stages;
  CascadeStage calibration;
  // detect runs only when the whole load completed.
  bool ready = false;
  bool stagesLoaded = false;
  bool calibrationLoaded = false;
};

}  // namespace tavilib

#endif  // TAVI_SRC_DETECTOR_DETECTOR_STATE_H_
