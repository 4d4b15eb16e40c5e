#include "detector/pyramid_scan.h"

#include <opencv2/imgproc.hpp>

#include <stdexcept>
#include <string>

#include "detector/image_planes.h"
#include "detector/pyramid_geometry.h"
#include "nn/net.h"

namespace tavilib {

namespace {

// Every cell of the output map becomes a window. Cells are placed by
// proportion: the last column maps to the last but one usable window column.
void appendLevelWindows(const nn::Blob<float>& probs, int32_t levelWidth, int32_t levelHeight,
                        float factor, int32_t level, int32_t windowSize,
                        std::vector<Window>& windows) {
  const int32_t mapWidth = probs.width();
  const int32_t mapHeight = probs.height();
  const float stepX = static_cast<float>(mapWidth - 1) /
                      static_cast<float>(levelWidth - windowSize - 1);
  const float stepY = static_cast<float>(mapHeight - 1) /
                      static_cast<float>(levelHeight - windowSize - 1);
  const int32_t cells = mapWidth * mapHeight;
  // Plane 1 is the face class.
  const float* faceProbability = probs.cpu_data() + cells;
  std::vector<Window> levelWindows(cells);
  for (int32_t i = 0; i < cells; ++i) {
    const int32_t row = i / mapWidth;
    const int32_t column = i % mapWidth;
    const int32_t x = static_cast<int32_t>(static_cast<float>(column) / stepX + 0.5f);
    const int32_t y = static_cast<int32_t>(static_cast<float>(row) / stepY + 0.5f);
    Window& window = levelWindows[i];
    window.x = static_cast<int32_t>(static_cast<float>(x) * factor);
    window.y = static_cast<int32_t>(static_cast<float>(y) * factor);
    window.width = static_cast<int32_t>(static_cast<float>(windowSize) * factor);
    window.height = window.width;
    window.score = faceProbability[i];
    window.level = level;
  }
  windows.insert(windows.end(), levelWindows.begin(), levelWindows.end());
}

}  // namespace

PyramidScan scanPyramid(const cv::Mat& image, const CascadeParameter& params,
                        CascadeStage& firstStage) {
  const PyramidGeometry geometry = computePyramidGeometry(image.cols, image.rows, params);
  nn::Net<float>& net = *firstStage.net;
  // A larger base image would overrun the scan net's buffers.
  if (geometry.baseWidth > net.declared_input_width() ||
      geometry.baseHeight > net.declared_input_height()) {
    throw std::invalid_argument("detect: a base image of " + std::to_string(geometry.baseWidth) +
                                " by " + std::to_string(geometry.baseHeight) +
                                " exceeds the scan net's input of " +
                                std::to_string(net.declared_input_width()) + " by " +
                                std::to_string(net.declared_input_height()) +
                                "; scanSettingsFor gives settings that fit");
  }
  cv::Mat base;
  cv::resize(image, base, cv::Size(geometry.baseWidth, geometry.baseHeight), 0, 0,
             cv::INTER_LINEAR);

  PyramidScan scan{{}, geometry.baseScale};
  for (int32_t level = 0; level < params.numScales; ++level) {
    const float factor = levelFactor(params.scaleStep, level);
    cv::Mat levelImage = base;
    if (level > 0) {
      const int32_t width = levelLength(geometry.baseWidth, factor);
      const int32_t height = levelLength(geometry.baseHeight, factor);
      if (width <= params.windowSize + 1 || height <= params.windowSize + 1) {
        break;
      }
      cv::resize(base, levelImage, cv::Size(width, height), 0, 0, cv::INTER_LINEAR);
    }
    net.AlterInputShape(levelImage.cols, levelImage.rows);
    const boost::shared_ptr<nn::Blob<float>> probs = net.output_blob();
    if (probs->width() < 2 || probs->height() < 2) {
      break;
    }
    writeImagePlanes(levelImage, net.net_input_blobs()[0]);
    net.FF();
    appendLevelWindows(*probs, levelImage.cols, levelImage.rows, factor, level, params.windowSize,
                       scan.windows);
  }
  return scan;
}

}  // namespace tavilib
