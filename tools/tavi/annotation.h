#ifndef TOOLS_TAVI_ANNOTATION_H_
#define TOOLS_TAVI_ANNOTATION_H_

#include <opencv2/core.hpp>

#include <string>

#include "tavi/face_report.h"

namespace tavi {

// Writes a copy of image with the report's boxes, scores and landmarks drawn
// on it to path (its extension picks the format; one OpenCV cannot write
// gives PNG, with ".png" added). The file appears whole or not at all: it is
// written under a temporary name and renamed. Returns the error, or an empty
// string.
std::string writeAnnotated(const cv::Mat& image, const ImageReport& report, std::string path);

}  // namespace tavi

#endif  // TOOLS_TAVI_ANNOTATION_H_
