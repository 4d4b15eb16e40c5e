#ifndef TAVI_SRC_DETECTOR_CASCADE_NET_TEXTS_H_
#define TAVI_SRC_DETECTOR_CASCADE_NET_TEXTS_H_

namespace tavilib {

// The network descriptions of the built-in cascade, in the text form of the
// network schema. Each declares the input "data" (1 x 3 x size x size) and
// ends in a softmax whose top is "probs". The trailing tabs of every line are
// white space to the parser.

// "200.79": the calibration net, 24 x 24 input, 19 classes.
extern const char kCalibrationNetText[];
// "900.175": the fully convolutional scan, 384 x 384 input, stride 6.
extern const char kStage0NetText[];
// "200.654": the 24 x 24 window grader, two branches.
extern const char kStage1NetText[];
// "100.113": the 48 x 48 window grader, three branches.
extern const char kStage2NetText[];

}  // namespace tavilib

#endif  // TAVI_SRC_DETECTOR_CASCADE_NET_TEXTS_H_
