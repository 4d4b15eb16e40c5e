#ifndef TOOLS_DETECTOR_TRAINING_TRAINING_DATA_H_
#define TOOLS_DETECTOR_TRAINING_TRAINING_DATA_H_

#include <opencv2/core.hpp>

#include <stdexcept>
#include <string>
#include <vector>

namespace training {

// A fault in the data folder: a missing file, an image that does not decode,
// a label line that does not parse. The message names the file and line.
class DataError : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

// One labelled face of a CSV of the data folder.
struct LabelledFace {
  std::string file;  // the image path, as the CSV gives it relative to its folder
  std::string person;
  std::vector<cv::Point2f> points;  // 68 landmarks
};

// A decoded image holding one face at box; the rest of the frame may hold
// other, unlabelled faces.
struct FaceImage {
  std::string file;
  cv::Mat pixels;  // 8-bit, 3 channels
  cv::Rect2f box;  // the project's face box
};

// Decoded images for the detector, split as they are used.
struct DetectorData {
  std::vector<FaceImage> faces;
  // Tight face crops: each whole crop is the face box.
  std::vector<cv::Mat> crops;
  // Images without any human face.
  std::vector<cv::Mat> negatives;
  std::vector<std::string> negativeFiles;
};

// faces68/<split>.csv or lfw68/labels.csv (whose extra columns are skipped),
// in file order.
std::vector<LabelledFace> readLabelledFaces(const std::string& csvPath);

// The training side: faces68 train, lfw68 without the persons of faces68 val,
// faces36, and 85% of negatives/ and of scenes/.
DetectorData loadTrainingData(const std::string& dataRoot);
// The held-out side: faces68 val and the other 15% of negatives/ and scenes/.
// No crops.
DetectorData loadValidationData(const std::string& dataRoot);

// Decodes an image as 8-bit 3-channel (grey files get three equal channels).
// Throws DataError naming the file when it does not decode.
cv::Mat readImage(const std::string& path);

}  // namespace training

#endif  // TOOLS_DETECTOR_TRAINING_TRAINING_DATA_H_
