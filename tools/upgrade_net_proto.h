#ifndef TOOLS_UPGRADE_NET_PROTO_H_
#define TOOLS_UPGRADE_NET_PROTO_H_

namespace tools {

// The two file forms of a NetParameter.
enum class NetProtoForm { kText, kBinary };

// The whole of an upgrade tool: with INPUT and OUTPUT as its arguments it reads
// a NetParameter of either generation in the given form from INPUT and writes
// the current generation, in the same form, to OUTPUT. Parameters the upgrade
// drops are reported on the standard error stream but don't fail the run, as
// they don't for the engine's readers. Returns the exit status: zero once
// OUTPUT is written; non-zero, with a message, when the arguments are wrong,
// INPUT cannot be read or parsed, or OUTPUT cannot be written.
int UpgradeNetProtoMain(int argc, char** argv, NetProtoForm form);

}  // namespace tools

#endif  // TOOLS_UPGRADE_NET_PROTO_H_
