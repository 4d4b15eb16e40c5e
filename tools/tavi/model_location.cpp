#include "tavi/model_location.h"

#include <filesystem>

namespace tavi {

namespace fs = std::filesystem;

std::string defaultModelFolder() {
  std::error_code error;
  const fs::path program = fs::read_symlink("/proc/self/exe", error);
  const std::string candidates[] = {
      error ? std::string() : (program.parent_path().parent_path() / TAVI_INSTALLED_MODELS).string() + "/",
      TAVI_SOURCE_MODELS,
  };
  for (const std::string& folder : candidates) {
    if (!folder.empty() && fs::is_regular_file(folder + "cascade.list", error)) {
      return folder;
    }
  }
  return {};
}

}  // namespace tavi
