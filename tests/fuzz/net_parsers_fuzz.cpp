// The network description and weight parsers below their fatal wrappers: any
// bytes give a message or a refusal, never a crash.
#include <cstddef>
#include <cstdint>
#include <string>

#include <google/protobuf/stubs/logging.h>

#include "nn/proto/nn.pb.h"
#include "nn/util/io.h"
#include "nn/util/upgrade_proto.h"

extern "C" int LLVMFuzzerInitialize(int*, char***) {
  // Parse errors are expected by the thousand; their log lines would drown
  // the fuzzer's own.
  google::protobuf::SetLogHandler(nullptr);
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  const std::string bytes(reinterpret_cast<const char*>(data), size);
  nn::NetParameter text;
  if (nn::ReadProtoFromTextFile1(bytes, &text)) {
    nn::NetParameterIsV0(text);
  }
  nn::NetParameter binary;
  if (binary.ParseFromString(bytes)) {
    nn::NetParameterIsV0(binary);
  }
  return 0;
}
