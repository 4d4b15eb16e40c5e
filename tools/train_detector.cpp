// Trains the face-detection cascade from the data folder and writes the model
// folder that Detector::load reads (and whose weights the built-in load
// finds):
//
//   build/tools/train_detector --data ../shared/data/ --work build/detector-training
//       --out Tavi/public/ --seed 1
//
// Prints each stage's windows, epochs, losses and validation pass rates.
// Interrupted, the same command resumes: finished stages are kept in the
// work folder, and a stage in progress goes on from its last epoch.
#include <boost/program_options.hpp>

#include <cstdio>
#include <exception>
#include <iostream>

#include "command_line.h"
#include "detector_training/cascade_training.h"

namespace po = boost::program_options;

namespace {

// Folders are used as prefixes: they must end in a separator.
std::string asFolder(std::string path) {
  if (!path.empty() && path.back() != '/') {
    path += '/';
  }
  return path;
}

}  // namespace

int main(int argc, char** argv) {
  training::CascadeTrainingOptions options;
  po::options_description described("train_detector: trains the face-detection cascade");
  described.add_options()("help", "this text")(
      "data", po::value<std::string>(&options.dataRoot)->default_value("../shared/data/"),
      "the data folder")(
      "work", po::value<std::string>(&options.workFolder)->default_value("build/detector-training"),
      "snapshots and finished stages; the run resumes from them")(
      "out", po::value<std::string>(&options.outputRoot)->default_value("Tavi/public/"),
      "where cascades/ and cascade.list are written")(
      "seed", po::value<unsigned>(&options.seed)->default_value(1), "random seed")(
      "shrink", po::value<int>(&options.shrink)->default_value(1),
      "use every n-th image and 1/n of the epochs, for a trial run")(
      "threads", po::value<int>(&options.threads)->default_value(2),
      "threads of the matrix library while a net trains");
  try {
    if (!tools::parseCommandLine(argc, argv, described)) {
      return 0;
    }
    options.dataRoot = asFolder(options.dataRoot);
    options.outputRoot = asFolder(options.outputRoot);
    if (options.shrink < 1 || options.threads < 1) {
      throw po::error("--shrink and --threads must be at least 1");
    }
    training::trainCascade(options);
  } catch (const po::error& error) {
    std::cerr << "train_detector: " << error.what() << "\n" << described << "\n";
    return 2;
  } catch (const std::exception& error) {
    std::cerr << "train_detector: " << error.what() << "\n";
    return 1;
  }
  return 0;
}
