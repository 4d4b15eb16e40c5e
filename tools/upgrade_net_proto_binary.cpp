// Upgrades a binary network weight file to the current generation.
#include "upgrade_net_proto.h"

int main(int argc, char** argv) {
  return tools::UpgradeNetProtoMain(argc, argv, tools::NetProtoForm::kBinary);
}
