#include "upgrade_net_proto.h"

#include <glog/logging.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <string>

#include "nn/proto/nn.pb.h"
#include "nn/util/io.h"
#include "nn/util/upgrade_proto.h"

namespace tools {

namespace {

using google::protobuf::Message;

struct FormTraits {
  const char* program;
  const char* what;
  bool (*read)(const std::string& filename, Message* proto);
  bool (*write)(const Message& proto, const std::string& filename);
};

FormTraits TraitsOf(NetProtoForm form) {
  if (form == NetProtoForm::kText) {
    return {"upgrade_net_proto_text.bin", "text description",
            [](const std::string& filename, Message* proto) {
              return nn::ReadProtoFromTextFile(filename, proto);
            },
            nn::WriteProtoToTextFile};
  }
  return {"upgrade_net_proto_binary.bin", "binary weight file",
          [](const std::string& filename, Message* proto) {
            return nn::ReadProtoFromBinaryFile(filename.c_str(), proto);
          },
          nn::WriteProtoToBinaryFile};
}

// The engine's readers end the process on a file they cannot open; a tool
// says so in its own words instead. A folder opens as a stream but reads as
// an empty message, which would write an empty net.
bool IsReadableFile(const std::string& filename) {
  std::error_code error;
  return !std::filesystem::is_directory(filename, error) && std::ifstream(filename).is_open();
}

}  // namespace

int UpgradeNetProtoMain(int argc, char** argv, NetProtoForm form) {
  FLAGS_logtostderr = true;
  google::InitGoogleLogging(argv[0]);
  const FormTraits traits = TraitsOf(form);
  if (argc != 3) {
    std::cerr << "Usage: " << traits.program << " INPUT OUTPUT\n"
              << "Reads a network " << traits.what << " of the old or the current generation"
              << " from INPUT and writes its current form to OUTPUT.\n";
    return EXIT_FAILURE;
  }
  const std::string input = argv[1];
  const std::string output = argv[2];
  if (!IsReadableFile(input)) {
    std::cerr << traits.program << ": cannot read " << input << "\n";
    return EXIT_FAILURE;
  }
  nn::NetParameter param;
  if (!traits.read(input, &param)) {
    std::cerr << traits.program << ": " << input << " is not a network " << traits.what << "\n";
    return EXIT_FAILURE;
  }
  if (nn::NetParameterIsV0(param)) {
    const nn::NetParameter v0_param(param);
    if (!nn::UpgradeV0Net(v0_param, &param)) {
      std::cerr << traits.program << ": parameters without a place in the current form"
                << " were dropped (see above)\n";
    }
  }
  if (!traits.write(param, output)) {
    std::cerr << traits.program << ": cannot write " << output << "\n";
    return EXIT_FAILURE;
  }
  return EXIT_SUCCESS;
}

}  // namespace tools
