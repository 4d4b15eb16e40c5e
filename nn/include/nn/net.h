#ifndef NN_NET_H_
#define NN_NET_H_

#include <boost/shared_ptr.hpp>

#include <map>
#include <string>
#include <vector>

#include "nn/blob.h"
#include "nn/layer.h"
#include "nn/proto/nn.pb.h"

namespace cv {
class Mat;
}  // namespace cv

namespace nn {

// How the string handed to a Net constructor is to be read.
enum class NetDescription { kFile, kText };

// A chain of layers and blobs assembled from a network description.
//
// A net is assembled once for its largest input. AlterInputShape then runs it
// at any smaller size by rewriting shape headers; no memory moves. A net meant
// to run that way is primed once with FirstRun and from then on runs with FF,
// which adds the first convolution's stored response to a constant image
// (bias included) to that layer's output.
//
// Not thread-safe: forward passes and shape changes rewrite shared buffers, so
// a net serves one thread at a time. Different nets share nothing.
template <typename Dtype>
class Net {
 public:
  // Assembles from a text description in a file (kFile) or held in memory
  // (kText). A file that can't be read or parsed ends the process.
  Net(const std::string& description, NetDescription kind);
  explicit Net(const NetParameter& param);
  virtual ~Net() = default;
  Net(const Net&) = delete;
  Net& operator=(const Net&) = delete;

  void Init(const NetParameter& in_param);

  // Replaces the weights of the layers whose names the weight file (binary
  // NetParameter) holds; other layers keep theirs. A blob of another shape
  // ends the process.
  void CopyTrainedLayersFrom(const std::string& trained_filename);
  void CopyTrainedLayersFrom(const NetParameter& param);

  // Primes the net: records the first convolution's response to an input of
  // constant 100 at the declared size.
  // REQUIRES: weights loaded; not primed yet; input at the declared size.
  void FirstRun();
  // A plain forward pass over the input blob as written by the caller.
  // REQUIRES: the net is not primed.
  const std::vector<Blob<Dtype>*>& Forward();
  // The forward pass of a primed net.
  // REQUIRES: FirstRun has run; the first layer is the first convolution.
  const std::vector<Blob<Dtype>*>& FF();
  // New input size in pixels; the output shape can be read at once.
  // REQUIRES: new_width and new_height at most the declared input size (not
  //   checked: larger sizes overrun the buffers at the next pass).
  void AlterInputShape(int new_width, int new_height);
  // Runs the layers in reverse, only those that need a gradient, from the
  // gradients the caller wrote into the output blobs' diffs. Leaves each
  // parameter blob's gradient in its diff.
  // REQUIRES: a forward pass over the same input ran last.
  void Backward();
  // Fills param with the net's name and, for each layer holding parameter
  // blobs, its description and blobs: the binary weight-file form.
  void ToProto(NetParameter* param) const;

  // A net of the same description taking num images at once, whose weights
  // are this net's own blobs (shared, not copied). Its layers are made with
  // constant fillers, so that making it draws no random numbers.
  // REQUIRES: the net has one input.
  boost::shared_ptr<Net> WithBatch(int num) const;

  // The blob named "probs"; empty if the net has none.
  boost::shared_ptr<Blob<Dtype>> output_blob() const;

  const std::vector<Blob<Dtype>*>& net_input_blobs() const { return net_input_blobs_; }
  // The first input's size as described, whatever AlterInputShape made of it
  // since; 0 for a net without inputs.
  int declared_input_width() const { return declaredInputWidth_; }
  int declared_input_height() const { return declaredInputHeight_; }
  const std::vector<Blob<Dtype>*>& output_blobs() const { return net_output_blobs_; }
  const std::vector<boost::shared_ptr<Layer<Dtype>>>& layers() const { return layers_; }
  const std::vector<std::string>& layer_names() const { return layer_names_; }
  const std::vector<std::string>& blob_names() const { return blob_names_; }
  const std::vector<boost::shared_ptr<Blob<Dtype>>>& blobs() const { return blobs_; }
  const std::vector<boost::shared_ptr<Blob<Dtype>>>& params() const { return params_; }
  const std::vector<std::vector<Blob<Dtype>*>>& bottom_vecs() const { return bottom_vecs_; }
  const std::vector<std::vector<Blob<Dtype>*>>& top_vecs() const { return top_vecs_; }
  const std::vector<bool>& layer_need_backward() const { return layer_need_backward_; }
  // Per parameter blob, parallel to params(): the description's learning-rate
  // and weight-decay multipliers (1 where it gives none).
  const std::vector<float>& params_lr() const { return params_lr_; }
  const std::vector<float>& params_weight_decay() const { return params_weight_decay_; }
  const std::string& name() const { return name_; }

 private:
  // The description as given, for WithBatch.
  NetParameter description_;
  std::vector<boost::shared_ptr<Layer<Dtype>>> layers_;
  std::vector<std::string> layer_names_;
  std::map<std::string, int> layer_names_index_;
  std::vector<bool> layer_need_backward_;
  std::vector<boost::shared_ptr<Blob<Dtype>>> blobs_;
  std::vector<boost::shared_ptr<Blob<unsigned char>>> blobs_u8_;
  std::vector<std::string> blob_names_;
  std::map<std::string, int> blob_names_index_;
  std::vector<bool> blob_need_backward_;
  std::vector<std::vector<Blob<Dtype>*>> bottom_vecs_;
  std::vector<std::vector<int>> bottom_id_vecs_;
  std::vector<std::vector<Blob<Dtype>*>> top_vecs_;
  std::vector<std::vector<int>> top_id_vecs_;
  std::vector<int> net_input_blob_indices_;
  std::vector<int> net_output_blob_indices_;
  std::vector<Blob<Dtype>*> net_output_blobs_;
  std::string name_;
  std::vector<boost::shared_ptr<Blob<Dtype>>> params_;
  std::vector<float> params_lr_;
  std::vector<float> params_weight_decay_;
  std::vector<Blob<unsigned char>*> net_input_blobs_u8_;
  std::vector<Blob<Dtype>*> net_input_blobs_;
  // Image-data layers could take decoded images from memory through these;
  // nothing sets them.
  bool useActiveImages_ = false;
  std::vector<boost::shared_ptr<cv::Mat>> activeImagePtrs_;
  int declaredInputWidth_ = 0;
  int declaredInputHeight_ = 0;
  bool firstRun_ = true;
  int firstConvLayerIndex_ = -1;
  // The negated response of the first convolution to a constant image, laid
  // out by the declared size.
  std::vector<float> firstConvOffset_;
};

}  // namespace nn

#endif  // NN_NET_H_
