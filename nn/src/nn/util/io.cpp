#include "nn/util/io.h"

#include <fcntl.h>
#include <glog/logging.h>
#include <google/protobuf/io/coded_stream.h>
#include <google/protobuf/io/zero_copy_stream_impl.h>
#include <google/protobuf/io/zero_copy_stream_impl_lite.h>
#include <google/protobuf/text_format.h>
#include <opencv2/core.hpp>
#include <opencv2/imgproc.hpp>
#include <sys/stat.h>
#include <unistd.h>

#include <fstream>
#include <memory>

#include "nn/util/upgrade_proto.h"

namespace nn {

using google::protobuf::io::ArrayInputStream;
using google::protobuf::io::CodedInputStream;
using google::protobuf::io::FileInputStream;
using google::protobuf::io::OstreamOutputStream;

bool ReadProtoFromTextFile(const char* filename, Message* proto) {
  int fd = open(filename, O_RDONLY);
  CHECK_NE(fd, -1) << "File not found: " << filename;
  // Holds the descriptor for the duration of the read; the text itself comes
  // through the line reader below.
  std::unique_ptr<FileInputStream> input(new FileInputStream(fd));
  std::string text;
  {
    std::ifstream lines(filename);
    std::string line;
    // The test comes before the read, so the text gains one empty last line.
    while (!lines.fail()) {
      // A failed getline keeps the old contents; the last line must not
      // come twice when the file does not end in a newline.
      line.clear();
      std::getline(lines, line);
      text += line;
      text += "\n";
    }
  }
  const bool success = ReadProtoFromTextFile1(text, proto);
  input.reset();
  close(fd);
  return success;
}

bool ReadProtoFromTextFile1(const std::string& text, Message* proto) {
  ArrayInputStream input(text.data(), static_cast<int>(text.size()));
  return google::protobuf::TextFormat::Parse(&input, proto);
}

bool ReadProtoFromBinaryFile(const char* filename, Message* proto) {
  int fd = open(filename, O_RDONLY);
  CHECK_NE(fd, -1) << "File not found: " << filename;
  struct stat file_status;
  if (fstat(fd, &file_status) == 0 && file_status.st_size >= kProtoReadBytesWarningThreshold) {
    LOG(WARNING) << "Reading a large weight file (" << file_status.st_size << " bytes) from "
                 << filename << "; files above " << kProtoReadBytesLimit
                 << " bytes are refused.";
  }
  std::unique_ptr<FileInputStream> raw_input(new FileInputStream(fd));
  std::unique_ptr<CodedInputStream> coded_input(new CodedInputStream(raw_input.get()));
  coded_input->SetTotalBytesLimit(kProtoReadBytesLimit);
  const bool success = proto->ParseFromCodedStream(coded_input.get());
  coded_input.reset();
  raw_input.reset();
  close(fd);
  return success;
}

void ReadProtoFromBinaryFileOrDie(const char* filename, Message* proto) {
  CHECK(ReadProtoFromBinaryFile(filename, proto));
}

bool WriteProtoToTextFile(const Message& proto, const std::string& filename) {
  std::ofstream file(filename, std::ios::binary | std::ios::trunc);
  bool printed = false;
  {
    // The stream flushes into the file when it goes.
    OstreamOutputStream output(&file);
    printed = google::protobuf::TextFormat::Print(proto, &output);
  }
  file.close();
  return printed && !file.fail();
}

bool WriteProtoToBinaryFile(const Message& proto, const std::string& filename) {
  std::ofstream file(filename, std::ios::binary | std::ios::trunc);
  const bool serialized = proto.SerializeToOstream(&file);
  file.close();
  return serialized && !file.fail();
}

bool ReadImageToDatum(const cv::Mat& image, int new_height, int new_width, Datum* datum) {
  // Three bytes a pixel are read whatever the image holds: refuse the rest.
  CHECK(image.empty() || image.type() == CV_8UC3)
      << "ReadImageToDatum takes 8-bit images of three channels, not of type " << image.type();
  cv::Mat resized = image;
  if (new_height > 0 && new_width > 0) {
    // The swap of width and height is how the data layers have always sized.
    cv::resize(image, resized, cv::Size(new_height, new_width), 0, 0, cv::INTER_LINEAR);
  }
  datum->set_channels(3);
  datum->set_height(resized.rows);
  datum->set_width(resized.cols);
  datum->set_label(0);
  datum->clear_data();
  std::string* buffer = datum->mutable_data();
  buffer->reserve(static_cast<size_t>(3) * resized.rows * resized.cols);
  for (int c = 2; c >= 0; --c) {
    for (int h = 0; h < resized.rows; ++h) {
      const cv::Vec3b* row = resized.ptr<cv::Vec3b>(h);
      for (int w = 0; w < resized.cols; ++w) {
        buffer->push_back(static_cast<char>(row[w][c]));
      }
    }
  }
  return true;
}

namespace {

void UpgradeNetAsNeeded(const std::string& param_file, const char* upgrade_tool,
                        NetParameter* param) {
  if (!NetParameterIsV0(*param)) {
    return;
  }
  LOG(ERROR) << "Attempting to upgrade input file specified using deprecated "
             << "V0LayerParameter: " << param_file;
  const NetParameter original_param(*param);
  if (!UpgradeV0Net(original_param, param)) {
    LOG(ERROR) << "Warning: had one or more problems upgrading "
               << "V0NetParameter to NetParameter (see above); continuing anyway.";
  }
  LOG(ERROR) << "Note that future releases will not support "
             << "V0NetParameter; use ./build/tools/" << upgrade_tool << " to "
             << "upgrade this and any other network proto files to the new format.";
}

}  // namespace

void ReadNetParamsFromTextFile(const std::string& param_file, NetParameter* param) {
  CHECK(ReadProtoFromTextFile(param_file, param))
      << "Failed to parse NetParameter file: " << param_file;
  UpgradeNetAsNeeded(param_file, "upgrade_net_proto_text.bin", param);
}

void ReadNetParamsFromText(const std::string& param_file, NetParameter* param) {
  CHECK(ReadProtoFromTextFile1(param_file, param))
      << "Failed to parse NetParameter file: " << param_file;
  UpgradeNetAsNeeded(param_file, "upgrade_net_proto_text.bin", param);
}

void ReadNetParamsFromBinaryFile(const std::string& param_file, NetParameter* param) {
  CHECK(ReadProtoFromBinaryFile(param_file.c_str(), param))
      << "Failed to parse NetParameter file: " << param_file;
  UpgradeNetAsNeeded(param_file, "upgrade_net_proto_binary.bin", param);
}

}  // namespace nn
