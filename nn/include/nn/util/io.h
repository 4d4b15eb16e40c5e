#ifndef NN_UTIL_IO_H_
#define NN_UTIL_IO_H_

#include <google/protobuf/message.h>

#include <string>

#include "nn/proto/nn.pb.h"

namespace cv {
class Mat;
}  // namespace cv

namespace nn {

using google::protobuf::Message;

// The weight-file reader refuses messages above this size...
constexpr int kProtoReadBytesLimit = 1073741824;
// ...and warns from this size on.
constexpr int kProtoReadBytesWarningThreshold = 536870912;

// Each reader returns whether the message parsed. A file that cannot be opened
// does not return: the check "fd != -1" ends the process with
// "File not found: " and the name.
bool ReadProtoFromTextFile(const char* filename, Message* proto);
inline bool ReadProtoFromTextFile(const std::string& filename, Message* proto) {
  return ReadProtoFromTextFile(filename.c_str(), proto);
}
// Parses a text-format message held in memory.
bool ReadProtoFromTextFile1(const std::string& text, Message* proto);
bool ReadProtoFromBinaryFile(const char* filename, Message* proto);
// The same for files the caller can't go on without: one that doesn't parse
// ends the process.
void ReadProtoFromBinaryFileOrDie(const char* filename, Message* proto);

// Each writer replaces the file with the message, in the text or the binary
// format, and returns whether all of it was written.
bool WriteProtoToTextFile(const Message& proto, const std::string& filename);
bool WriteProtoToBinaryFile(const Message& proto, const std::string& filename);

// These return only with a usable message, upgraded from the old description
// generation where needed; a file that fails to parse ends the process.
void ReadNetParamsFromTextFile(const std::string& param_file, NetParameter* param);
// Here param_file holds the description text itself.
void ReadNetParamsFromText(const std::string& param_file, NetParameter* param);
void ReadNetParamsFromBinaryFile(const std::string& param_file, NetParameter* param);

// Fills datum with a 3-channel 8-bit image, resized first (bilinear) when
// both sizes are above 0, with new_height as the width and new_width as the
// height: callers pass them in this order. The planes go last channel first,
// so blue-green-red pixels give a red-green-blue record. The label is 0.
// Returns true.
// REQUIRES: image is empty or of type CV_8UC3 (checked).
bool ReadImageToDatum(const cv::Mat& image, int new_height, int new_width, Datum* datum);

}  // namespace nn

#endif  // NN_UTIL_IO_H_
