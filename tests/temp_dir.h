#ifndef TESTS_TEMP_DIR_H_
#define TESTS_TEMP_DIR_H_

#include <filesystem>
#include <fstream>
#include <string>

// A fresh folder under the system's temporary directory, removed with all it
// holds when the object goes.
class TempDir {
 public:
  TempDir() {
    std::string pattern = (std::filesystem::temp_directory_path() / "tavi-test-XXXXXX").string();
    path_ = mkdtemp(pattern.data());
  }
  ~TempDir() { std::filesystem::remove_all(path_); }
  TempDir(const TempDir&) = delete;
  TempDir& operator=(const TempDir&) = delete;

  const std::string& path() const { return path_; }

  // Writes contents to name inside the folder and gives its full path.
  std::string write(const std::string& name, const std::string& contents) const {
    const std::string file = path_ + "/" + name;
    std::filesystem::create_directories(std::filesystem::path(file).parent_path());
    std::ofstream(file, std::ios::binary) << contents;
    return file;
  }

 private:
  std::string path_;
};

#endif  // TESTS_TEMP_DIR_H_
