// The Python module tavi: numpy images in, faces and landmarks out, through
// the public tavilib interface only.
#include <pybind11/numpy.h>
#include <pybind11/pybind11.h>
#include <pybind11/stl.h>

#include <dlfcn.h>

#include <atomic>
#include <charconv>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <mutex>
#include <shared_mutex>
#include <stdexcept>
#include <string>
#include <vector>

#include "tavilib.h"

namespace py = pybind11;

namespace {

// Pixels as the library takes them: three bytes, blue, green, red, rows
// tightly packed.
struct Pixels {
  int32_t width = 0;
  int32_t height = 0;
  std::vector<unsigned char> bytes;
  tavilib::Image image() { return tavilib::Image{width, height, 0, bytes.data()}; }
};

Pixels toPixels(const py::array& array) {
  if (!py::isinstance<py::array_t<uint8_t>>(array) || array.dtype().kind() != 'u' ||
      array.itemsize() != 1) {
    throw py::value_error("expected a uint8 array, got dtype " +
                          std::string(py::str(array.dtype())));
  }
  const int channels = array.ndim() == 2 ? 1 : array.ndim() == 3 ? static_cast<int>(array.shape(2)) : 0;
  if (channels != 1 && channels != 3 && channels != 4) {
    throw py::value_error("expected an image of shape (h, w), (h, w, 3) or (h, w, 4)");
  }
  if (array.shape(0) < 1 || array.shape(1) < 1) {
    throw py::value_error("expected an image with pixels");
  }
  // A contiguous copy whatever the strides of the array.
  const auto packed = py::array_t<uint8_t, py::array::c_style | py::array::forcecast>::ensure(array);
  Pixels pixels;
  pixels.height = static_cast<int32_t>(array.shape(0));
  pixels.width = static_cast<int32_t>(array.shape(1));
  const size_t count = static_cast<size_t>(pixels.width) * static_cast<size_t>(pixels.height);
  pixels.bytes.resize(count * 3);
  const uint8_t* from = packed.data();
  for (size_t i = 0; i < count; ++i) {
    for (int c = 0; c < 3; ++c) {
      // Grey repeats its one sample; an alpha channel is dropped.
      pixels.bytes[3 * i + c] = from[i * static_cast<size_t>(channels) + (channels == 1 ? 0 : c)];
    }
  }
  return pixels;
}

// The installed models beside the module (so that an installed tree may
// move), else those of the source tree the module was built from.
std::string defaultModels() {
  Dl_info module{};
  dladdr(reinterpret_cast<void*>(&defaultModels), &module);
  const std::string installed =
      module.dli_fname == nullptr
          ? std::string()
          : (std::filesystem::path(module.dli_fname).parent_path() / TAVI_MODULE_TO_MODELS).string() + "/";
  for (const std::string& folder : {installed, std::string(TAVI_SOURCE_MODELS)}) {
    if (!folder.empty() && std::ifstream(folder + "cascade.list").good()) return folder;
  }
  return installed;
}

// The shortest decimal that reads back as the same float.
std::string floatText(float value) {
  char text[32];
  const std::to_chars_result end = std::to_chars(text, text + sizeof text, value);
  return std::string(text, end.ptr);
}

struct Face {
  std::vector<float> box;  // left, top, right, bottom
  float score;
};

class Detector {
 public:
  explicit Detector(const py::object& models) {
    root_ = models.is_none() ? defaultModels() : py::str(models).cast<std::string>();
    if (!root_.empty() && root_.back() != '/') root_ += '/';
    std::string fault;
    const tavilib::DetectorParams params(root_.c_str(), "cascade.list");
    if (tavilib::checkDetectorModel(params, fault) != tavilib::STATUS_OK ||
        detector_.load(params) != tavilib::STATUS_OK) {
      throw py::value_error("the cascade in " + root_ + " cannot be used: " + fault);
    }
  }

  std::vector<Face> detect(const py::array& array, int minFace) {
    Pixels pixels = toPixels(array);
    if (minFace < 1) throw py::value_error("min_face must be at least 1");
    if (busy_.exchange(true)) {
      throw std::runtime_error(
          "this Detector is detecting on another thread; create one Detector per thread");
    }
    struct Done {
      std::atomic<bool>& busy;
      ~Done() { busy = false; }
    } done{busy_};
    std::vector<tavilib::Detection> found;
    {
      py::gil_scoped_release free;
      tavilib::ScanSettings scan{};
      tavilib::scanSettingsFor(detector_, pixels.width, pixels.height, minFace, scan);
      tavilib::detect(pixels.image(), detector_, found, scan.params);
    }
    std::vector<Face> faces;
    for (const tavilib::Detection& d : found) {
      faces.push_back({{d.box.left, d.box.top, d.box.right, d.box.bottom}, d.score});
    }
    return faces;
  }

 private:
  std::string root_;
  tavilib::Detector detector_;
  std::atomic<bool> busy_{false};
};

// The library holds one landmark model per process: alignments share it,
// and a load waits until none runs.
std::shared_mutex modelLock;
std::string loadedModel;

class Landmarks {
 public:
  explicit Landmarks(const py::object& model) {
    path_ = model.is_none() ? defaultModels() + "landmarks.sdm" : py::str(model).cast<std::string>();
    std::unique_lock<std::shared_mutex> lock(modelLock);
    if (loadedModel == path_) return;
    std::string fault;
    const std::filesystem::path file(path_);
    const std::string folder = file.has_parent_path() ? file.parent_path().string() : ".";
    const std::string name = file.filename().string();
    if (tavilib::checkSDMModel(folder, name, fault) != tavilib::STATUS_OK ||
        tavilib::loadSDMModel(folder, name) != tavilib::STATUS_OK) {
      throw py::value_error("the landmark model " + path_ + " cannot be used: " + fault);
    }
    loadedModel = path_;
  }

  py::array_t<float> align(const py::array& array, const std::vector<float>& box, int points) {
    if (box.size() != 4) throw py::value_error("box must be (left, top, right, bottom)");
    if (points != 68 && points != 5) throw py::value_error("points must be 68 or 5");
    Pixels pixels = toPixels(array);
    std::vector<float> result;
    {
      py::gil_scoped_release free;
      std::shared_lock<std::shared_mutex> lock(modelLock);
      if (loadedModel != path_) {
        throw std::runtime_error("another landmark model was loaded since; one model per process");
      }
      const tavilib::Rectangle<float> rect{box[0], box[1], box[2], box[3]};
      if (points == 68) {
        tavilib::align68Points(pixels.image(), rect, result);
      } else {
        tavilib::align5Points(pixels.image(), rect, result);
      }
    }
    py::array_t<float> out({static_cast<py::ssize_t>(result.size() / 2), static_cast<py::ssize_t>(2)});
    std::memcpy(out.mutable_data(), result.data(), result.size() * sizeof(float));
    return out;
  }

 private:
  std::string path_;
};

}  // namespace

PYBIND11_MODULE(tavi, m) {
  m.doc() = "Face detection and 68-point facial landmarks (the tavi library).";
  py::register_exception_translator([](std::exception_ptr p) {
    try {
      if (p) std::rethrow_exception(p);
    } catch (const std::invalid_argument& e) {
      PyErr_SetString(PyExc_ValueError, e.what());
    }
  });
  py::class_<Face>(m, "Face", "A face: box (left, top, right, bottom) in pixels, score in 0..1.")
      .def_property_readonly("box", [](const Face& f) { return py::make_tuple(f.box[0], f.box[1], f.box[2], f.box[3]); })
      .def_readonly("score", &Face::score)
      .def("__repr__", [](const Face& f) {
        return "Face(box=(" + floatText(f.box[0]) + ", " + floatText(f.box[1]) + ", " +
               floatText(f.box[2]) + ", " + floatText(f.box[3]) + "), score=" + floatText(f.score) + ")";
      });
  py::class_<Detector>(m, "Detector",
                       "A face detector. One per thread: detect refuses to run on two threads at "
                       "once. models: a model folder (cascade.list, cascades/); default the "
                       "installed models.")
      .def(py::init<const py::object&>(), py::arg("models") = py::none())
      .def("detect", &Detector::detect, py::arg("image"), py::arg("min_face") = 40,
           "Faces in a uint8 image of shape (h, w, 3) in blue-green-red order, as cv2.imread "
           "gives it ((h, w) grey and (h, w, 4) are converted), best first, of min_face pixels "
           "and up. Releases the GIL while it runs.");
  py::class_<Landmarks>(m, "Landmarks",
                        "The landmark model (one per process). model: a model file; default the "
                        "installed landmarks.sdm.")
      .def(py::init<const py::object&>(), py::arg("model") = py::none())
      .def("align", &Landmarks::align, py::arg("image"), py::arg("box"), py::arg("points") = 68,
           "A (68, 2) or (5, 2) float32 array of landmarks, x and y in pixels, for the face in box "
           "(left, top, right, bottom). Releases the GIL; any number of threads may align at once.");
  m.attr("default_models") = defaultModels();
}
