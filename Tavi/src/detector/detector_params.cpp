#include "tavilib.h"

namespace tavilib {

namespace {
const char* const kEmpty = "";
}  // namespace

DetectorParams::DetectorParams() : cascadeRoot(kEmpty), cascadeList(kEmpty), reserved(1) {}

DetectorParams::DetectorParams(const DetectorParams& other) = default;

DetectorParams::DetectorParams(const char* const& cascadeRoot, const char* const& cascadeList)
    : cascadeRoot(cascadeRoot), cascadeList(cascadeList), reserved(1) {}

DetectorParams::~DetectorParams() = default;

DetectorParams& DetectorParams::operator=(const DetectorParams& other) = default;

}  // namespace tavilib
