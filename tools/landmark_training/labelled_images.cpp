#include "landmark_training/labelled_images.h"

#include "detector_training/face_box.h"
#include "detector_training/training_data.h"

namespace landmarks {

void addLabelledImages(const std::string& csvPath, const std::set<std::string>& leftOutPersons,
                       LabelledImages* labelled) {
  const std::string folder = csvPath.substr(0, csvPath.find_last_of('/') + 1);
  for (const training::LabelledFace& face : training::readLabelledFaces(csvPath)) {
    if (leftOutPersons.count(face.person) > 0) {
      continue;
    }
    labelled->images.push_back(training::readImage(folder + face.file));
    labelled->persons.push_back(
        labelled->personNumbers.emplace(face.person, labelled->personNumbers.size()).first->second);
    std::vector<float> flat;
    for (const cv::Point2f& point : face.points) {
      flat.push_back(point.x);
      flat.push_back(point.y);
    }
    labelled->truths.push_back(std::move(flat));
    labelled->faces.push_back(training::faceBoxFromPoints(face.points));
  }
}

std::set<std::string> personsOf(const std::string& csvPath) {
  std::set<std::string> persons;
  for (const training::LabelledFace& face : training::readLabelledFaces(csvPath)) {
    persons.insert(face.person);
  }
  return persons;
}

}  // namespace landmarks
