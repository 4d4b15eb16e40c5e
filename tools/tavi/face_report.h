#ifndef TOOLS_TAVI_FACE_REPORT_H_
#define TOOLS_TAVI_FACE_REPORT_H_

#include <string>
#include <vector>

#include "tavilib.h"

namespace tavi {

struct FoundFace {
  tavilib::Rectangle<float> box;
  float score;
  // x and y interleaved, in pixels; empty without --landmarks.
  std::vector<float> points;
};

// What one input file gave: its faces, or the error that stopped it.
struct ImageReport {
  std::string file;
  int width = 0;
  int height = 0;
  // The smallest face sought, in pixels; above the one asked for where the
  // scan net could not search this large an image for smaller faces.
  int minFace = 0;
  std::vector<FoundFace> faces;
  std::string error;  // empty when the file was read
  std::string drawError;  // empty when the annotated copy was written (or not asked for)
};

// One JSON object on one line (without the newline):
// {"file":...,"width":...,"height":...,"min_face":...,"faces":[{"box":[l,t,r,b],
// "score":s,"points":[[x,y],...]}]} with "draw_error" behind where the
// annotated copy failed, or {"file":...,"error":...}.
std::string jsonLine(const ImageReport& report);

// The CSV header for points landmarks per face (0 for none), and the rows of
// one report: one per face, or one without face columns for an image without
// faces; none for a file that was not read.
std::string csvHeader(int points);
std::string csvRows(const ImageReport& report, int points);

}  // namespace tavi

#endif  // TOOLS_TAVI_FACE_REPORT_H_
