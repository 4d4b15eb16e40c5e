#include "tavi/image_inputs.h"

#include <algorithm>
#include <filesystem>

namespace tavi {

namespace fs = std::filesystem;

ImageInputs listInputs(const std::vector<std::string>& arguments) {
  ImageInputs inputs;
  for (const std::string& argument : arguments) {
    std::error_code error;
    if (!fs::is_directory(argument, error)) {
      inputs.files.push_back({argument, fs::path(argument).filename().string()});
      continue;
    }
    inputs.anyFolder = true;
    std::vector<fs::path> found;
    for (fs::recursive_directory_iterator entry(argument, fs::directory_options::skip_permission_denied, error), end;
         !error && entry != end; entry.increment(error)) {
      if (!entry->is_directory(error)) {
        found.push_back(entry->path());
      }
    }
    std::sort(found.begin(), found.end());
    for (const fs::path& file : found) {
      inputs.files.push_back({file.string(), file.lexically_relative(argument).string()});
    }
  }
  return inputs;
}

}  // namespace tavi
