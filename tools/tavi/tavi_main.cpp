// tavi detect: faces, and optionally landmarks, in photos, as JSON lines or
// CSV on standard output.

#include <cblas.h>
#include <unistd.h>

#include <boost/program_options.hpp>

#include <cstdio>
#include <iostream>
#include <string>
#include <vector>

#include "tavi/batch.h"
#include "tavi/face_report.h"
#include "tavi/image_inputs.h"
#include "tavi/model_location.h"
#include "tavilib.h"

namespace po = boost::program_options;

namespace {

constexpr int kUsageError = 2;
constexpr int kFileError = 1;

const char kUsage[] =
    "usage: tavi detect [options] IMAGE|FOLDER...\n"
    "Finds faces in images (every file below a folder) and prints one JSON object per\n"
    "image and line, or CSV rows with --csv. Exit status: 0 when every file was read\n"
    "(and drawn), 1 when some were not, 2 on a usage or model error.\n";

void showProgress(size_t done, size_t total) {
  constexpr int kWidth = 30;
  const int filled = static_cast<int>(kWidth * done / std::max<size_t>(total, 1));
  std::fprintf(stderr, "\r[%s%s] %zu/%zu", std::string(static_cast<size_t>(filled), '#').c_str(),
               std::string(static_cast<size_t>(kWidth - filled), '.').c_str(), done, total);
  std::fflush(stderr);
}

int runDetect(const po::variables_map& values, const tavi::FinderSettings& settings, int threads) {
  const tavi::ImageInputs inputs = tavi::listInputs(values["input"].as<std::vector<std::string>>());
  std::string fault;
  if (tavilib::checkDetectorModel(tavilib::DetectorParams(settings.models.c_str(), "cascade.list"),
                                  fault) != tavilib::STATUS_OK) {
    std::cerr << "tavi: the cascade cannot be used: " << fault << "\n";
    return kUsageError;
  }
  if (settings.landmarks != 0) {
    if (tavilib::checkSDMModel(settings.models, "landmarks.sdm", fault) != tavilib::STATUS_OK) {
      std::cerr << "tavi: the landmark model cannot be used: " << fault << "\n";
      return kUsageError;
    }
    tavilib::loadSDMModel(settings.models, "landmarks.sdm");
  }
  const bool csv = values.count("csv") > 0;
  if (csv) {
    std::cout << tavi::csvHeader(settings.landmarks);
  }
  const bool bar = inputs.anyFolder && isatty(fileno(stderr)) != 0;
  bool everyFile = true;
  tavi::runBatch(
      inputs.files, settings, threads,
      [&](const tavi::ImageReport& report) {
        for (const std::string* error : {&report.error, &report.drawError}) {
          if (!error->empty()) {
            everyFile = false;
            std::cerr << (bar ? "\r" : "") << "tavi: " << report.file << ": " << *error << "\n";
          }
        }
        std::cout << (csv ? tavi::csvRows(report, settings.landmarks) : tavi::jsonLine(report) + "\n");
        std::cout.flush();
      },
      [&](size_t done) {
        if (bar) {
          showProgress(done, inputs.files.size());
        }
      });
  if (bar) {
    std::fputc('\n', stderr);
  }
  tavilib::unloadSDMModel();
  return everyFile ? 0 : kFileError;
}

}  // namespace

int main(int argc, char** argv) {
  // Each worker runs its own detector on one core; the batch-one products of
  // the cascade only lose by spreading over threads.
  openblas_set_num_threads(1);
  tavi::FinderSettings settings;
  int threads = 1;
  po::options_description options("options");
  options.add_options()("help,h", "this text")(
      "landmarks", po::value<int>(&settings.landmarks)->default_value(0),
      "68 or 5: landmarks of each face (0: none)")("csv", "CSV rows instead of JSON lines")(
      "draw", po::value<std::string>(&settings.drawFolder),
      "write annotated copies into this folder")(
      "min-face", po::value<int>(&settings.minFace)->default_value(40),
      "smallest face sought, pixels")("threads", po::value<int>(&threads)->default_value(1),
                                      "images processed at once, each with its own detector")(
      "models", po::value<std::string>(&settings.models),
      "model folder with cascade.list, cascades/ and landmarks.sdm (default: the installed one)");
  po::options_description hidden;
  hidden.add_options()("command", po::value<std::string>())(
      "input", po::value<std::vector<std::string>>());
  po::options_description all;
  all.add(options).add(hidden);
  po::positional_options_description positions;
  positions.add("command", 1).add("input", -1);
  po::variables_map values;
  try {
    po::store(po::command_line_parser(argc, argv).options(all).positional(positions).run(), values);
    po::notify(values);
  } catch (const po::error& error) {
    std::cerr << "tavi: " << error.what() << "\n" << kUsage << options;
    return kUsageError;
  }
  if (values.count("help") > 0) {
    std::cout << kUsage << options;
    return 0;
  }
  const char* problem = nullptr;
  if (values.count("command") == 0 || values["command"].as<std::string>() != "detect") {
    problem = "the only command is detect";
  } else if (values.count("input") == 0) {
    problem = "no image or folder given";
  } else if (settings.landmarks != 0 && settings.landmarks != 5 && settings.landmarks != 68) {
    problem = "--landmarks takes 68 or 5";
  } else if (settings.minFace < 1 || threads < 1) {
    problem = "--min-face and --threads take numbers of at least 1";
  }
  if (settings.models.empty()) {
    settings.models = tavi::defaultModelFolder();
    if (problem == nullptr && settings.models.empty()) {
      problem = "no installed models found; give --models";
    }
  } else if (settings.models.back() != '/') {
    settings.models += '/';
  }
  if (problem != nullptr) {
    std::cerr << "tavi: " << problem << "\n" << kUsage << options;
    return kUsageError;
  }
  try {
    return runDetect(values, settings, threads);
  } catch (const std::exception& error) {
    std::cerr << "tavi: " << error.what() << "\n";
    return kUsageError;
  }
}
