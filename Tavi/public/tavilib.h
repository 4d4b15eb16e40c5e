#ifndef TAVI_PUBLIC_TAVILIB_H_
#define TAVI_PUBLIC_TAVILIB_H_

// tavilib finds human faces in an image (detect) and places 68 facial
// landmarks on a face rectangle (align68Points, align5Points).
//
// Threads: a Detector serves one thread at a time, since detect rewrites the
// state of its networks; different Detector objects may detect at once. Loads
// of different Detector objects are serialised internally. The alignment model
// is one per process: any number of alignments may run at once on a loaded
// model, but loadSDMModel and unloadSDMModel must not overlap them, and nothing
// guards this.
//
// Errors: the functions return a Status. A missing or malformed network file
// ends the process through the fatal logging of the network engine; check the
// model folder before loading if that is not acceptable. Exceptions of the
// image library (an empty image, a null buffer) and of allocation pass through
// to the caller.

#include <cstdint>
#include <string>
#include <vector>

#if defined(_WIN32)
#define TAVI_EXPORT __declspec(dllexport)
#else
#define TAVI_EXPORT __attribute__((visibility("default")))
#endif

namespace tavilib {

// The only values an exported function returns.
enum Status : int32_t {
  STATUS_OK = 0,
  // No cascade stage was loaded, the calibration net is missing, or the
  // alignment model file was refused (also from an alignment without a model).
  STATUS_MODEL_LOAD_FAILED = -3,
  // The Detector holds no state, or one whose load did not complete.
  STATUS_DETECTOR_NOT_READY = -6,
};

// A decoded image, borrowed for the length of one call. Pixels are three
// interleaved 8-bit samples in the order blue, green, red; rows run from the
// top down. stride is the distance in bytes between rows, 0 for tightly packed
// rows (width * 3). detect honours stride; the alignment functions always
// assume tightly packed rows.
struct Image {
  int32_t width;
  int32_t height;
  int32_t stride;
  unsigned char* data;
};

// Edges in pixels of the image passed in; right and bottom are exclusive.
template <typename T>
struct Rectangle {
  T left;
  T top;
  T right;
  T bottom;
};

class Detection {
 public:
  Rectangle<float> box;
  // Face probability from the last cascade stage, between 0 and 1.
  float score;
};

// Scan settings of one detect call; the host sets all six fields.
class CascadeParameter {
 public:
  // Largest factor by which an image smaller than normalizedSize is enlarged.
  float maxUpscale;
  // Length in pixels to which the longer image edge is normalised.
  int32_t normalizedSize;
  // Smallest face sought, as a fraction of normalizedSize.
  float minFaceRatio;
  // Most pyramid levels scanned.
  int32_t numScales;
  // Ratio between neighbouring pyramid levels, above 1.
  float scaleStep;
  // Side in pixels of a pyramid level of the window one output cell of the
  // first network stands for.
  int32_t windowSize;
};

// Where a cascade model folder lies. Both pointers are borrowed, not copied:
// the strings must outlive the load call.
struct TAVI_EXPORT DetectorParams {
  // Both strings empty.
  DetectorParams();
  DetectorParams(const DetectorParams& other);
  DetectorParams(const char* const& cascadeRoot, const char* const& cascadeList);
  ~DetectorParams();
  DetectorParams& operator=(const DetectorParams& other);

  // Prefix of every cascade file, used as a plain string: it must end in a
  // path separator.
  const char* cascadeRoot;
  // Name of the list file, relative to cascadeRoot.
  const char* cascadeList;
  // Set to 1; read by nothing.
  int32_t reserved;
};

class DetectorState;

// A loaded face-detection cascade.
//
// Copy assignment shares the state without counting owners: each copy deletes
// it on unload or destruction, so two copies must not both go out of scope.
class TAVI_EXPORT Detector {
 public:
  Detector();
  ~Detector();
  Detector& operator=(const Detector& other);

  // Loads the built-in cascade; its weight files are looked up relative to the
  // working directory. Any earlier state is released first, also when the new
  // load then fails.
  Status load();
  // Loads the cascade named by the list file of a model folder.
  Status load(const DetectorParams& params);
  // Releases the state; harmless when nothing is loaded.
  void unload();
  // True whenever a state object exists, also after a failed load: the Status
  // of load, not this, tells whether detect can run.
  bool is_loaded() const;
  // The state, opaque to the host.
  const void* getDetector() const;

 private:
  DetectorState* detector_;
};

TAVI_EXPORT Status loadDetector(Detector& detector);
TAVI_EXPORT Status loadDetector(Detector& detector, const DetectorParams& params);
TAVI_EXPORT void unloadDetector(Detector& detector);

// Finds faces and appends them to detections, best score first; what the
// vector held before stays in front. A detector that is not loaded, or whose
// last load failed, gives STATUS_DETECTOR_NOT_READY and leaves detections as
// they were.
// REQUIRES: image.data holds image.height rows of image.stride bytes (of
//   width * 3 when stride is 0), each starting with width pixels.
// REQUIRES: params have normalizedSize, windowSize, minFaceRatio and maxUpscale
//   above 0, a finite scaleStep above 1, and give a base image within the first
//   network's declared input (384 by 384 with the built-in load, 640 by 640
//   from the shipped folder); scanSettingsFor gives such settings. Otherwise
//   detect throws std::invalid_argument, as for a negative stride or one below
//   width * 3, and leaves detections as they were.
// REQUIRES: no other thread uses the same Detector during the call.
TAVI_EXPORT Status detect(const Image& image, const Detector& detector,
                          std::vector<Detection>& detections, const CascadeParameter& params);

// Checks the model folder that load(params) would read, without loading it
// and without ending the process: the list file (present, at least one stage,
// each line a folder and a threshold ending in a newline), each stage and the
// calibration net (description and weights present and parsing, layers of
// kinds a detection net runs, weights of the shapes the description gives, a
// mean of the input's size, a calibration table the net's classes cover).
// Gives STATUS_OK and an empty message, or STATUS_MODEL_LOAD_FAILED and a
// message "path: what" naming the first fault. Descriptions of the old
// generation are refused (convert them with upgrade_net_proto_text).
// A description whose layers parse but do not fit each other (a kernel larger
// than its input, say) still ends the process, as a load would.
TAVI_EXPORT Status checkDetectorModel(const DetectorParams& params, std::string& message);

// Scan settings for detect, chosen for one loaded detector and one image size.
struct ScanSettings {
  CascadeParameter params;
  // The smallest face, in pixels of the image, that params look for: the one
  // asked for, or the smallest larger one whose base image fits the scan
  // net's declared input (a large image searched for small faces).
  int32_t minFace;
};

// Fills settings to find faces of minFace pixels and up in images of width by
// height pixels with detector: the image is scanned at its own size (faces
// below the 12-pixel scan window by enlarging it), pyramid levels a factor 1.2
// apart. Gives STATUS_DETECTOR_NOT_READY, and leaves settings as they were,
// when the detector holds no completed load.
// Throws std::invalid_argument when width, height or minFace is below 1.
TAVI_EXPORT Status scanSettingsFor(const Detector& detector, int32_t width, int32_t height,
                                   int32_t minFace, ScanSettings& settings);

// Loads the alignment model from the file folder + "/" + file, replacing any
// model loaded before (which is dropped even if this load then fails).
// A file whose sizes would take the alignment outside its arrays (stage maps
// that do not fit the mean shape, levels beyond the descriptor pyramid,
// settings out of range) or that ends early is refused like a missing one.
// REQUIRES: no alignment runs during the call.
TAVI_EXPORT Status loadSDMModel(const std::string& folder, const std::string& file);
// Checks the alignment model file folder + "/" + file as loadSDMModel would
// read it, without loading it: a complete file of a 68-point model whose
// stage maps, levels and settings alignment can use. Gives STATUS_OK and an
// empty message, or STATUS_MODEL_LOAD_FAILED and a message "path: what".
TAVI_EXPORT Status checkSDMModel(const std::string& folder, const std::string& file,
                                 std::string& message);
// Releases the alignment model; STATUS_OK also when none is loaded.
// REQUIRES: no alignment runs during the call.
TAVI_EXPORT Status unloadSDMModel();
// Replaces the contents of points by 68 landmarks as 136 floats, interleaved
// x and y, in pixels of image. Without a loaded 68-point model (none loaded,
// or the last load failed) gives STATUS_MODEL_LOAD_FAILED and no points.
// REQUIRES: image rows are tightly packed (stride is ignored): image.data
//   holds width * height * 3 bytes.
// REQUIRES: image has pixels and rect is finite and leaves some of them in
//   its crop; otherwise std::invalid_argument is thrown (a rectangle wholly
//   outside the image raises the image library's exception).
TAVI_EXPORT Status align68Points(const Image& image, const Rectangle<float>& rect,
                                 std::vector<float>& points);
// Replaces the contents of points by five landmarks as 10 floats: the centres
// of the right and left eye, the nose tip, the right and left mouth corner.
// REQUIRES: as align68Points.
TAVI_EXPORT Status align5Points(const Image& image, const Rectangle<float>& rect,
                                std::vector<float>& points);

}  // namespace tavilib

#endif  // TAVI_PUBLIC_TAVILIB_H_
