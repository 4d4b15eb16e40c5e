#include <gtest/gtest.h>

#include <cmath>
#include <vector>

#include "gradient_checker.h"

namespace nn {
namespace {

// x (1 + s) ^ -0.75 for the sums of squares s of each cell's window; alpha
// equals the window size in the layers below, so that it cancels.
void ExpectNormalised(const std::vector<float>& out, const std::vector<float>& x,
                      const std::vector<float>& sums) {
  ASSERT_EQ(out.size(), x.size());
  for (size_t i = 0; i < x.size(); ++i) {
    EXPECT_NEAR(out[i], x[i] * std::pow(1.0 + sums[i], -0.75), 1e-6) << "cell " << i;
  }
}

TEST(LRNLayerTest, WindowsAcrossChannelsAfterAShrinkAndWithinAChannel) {
  // Channels 1, 2, 3, 4 at the first position and 4, 3, 2, 1 at the second,
  // set up at a larger size first.
  Blob<float> in(1, 4, 2, 2);
  OneLayer across("type: LRN lrn_param { local_size: 3 alpha: 3 }", &in);
  in.RewriteShape(1, 4, 1, 2);
  const std::vector<float> x = {1, 4, 2, 3, 3, 2, 4, 1};
  SetValues(&in, x);
  across.layer->AlterInputShape(2, 1, across.bottom, &across.top);
  EXPECT_EQ(Shape(across.out), (std::vector<int>{1, 4, 1, 2}));
  // Channels c - 1 to c + 1, none beyond the ends.
  ExpectNormalised(across.Forward(), x, {5, 25, 14, 29, 29, 14, 25, 5});
  // An even size is one short on the leading side: c - 1 to c + 2.
  ExpectNormalised(OneLayer("type: LRN lrn_param { local_size: 4 alpha: 4 }", &in).Forward(), x,
                   {14, 29, 30, 30, 29, 14, 25, 5});

  // Within a channel: a zero-padded 3 x 3 window, divided by its full size.
  Blob<float> row(1, 1, 1, 4);
  SetValues(&row, {1, 2, 3, 4});
  ExpectNormalised(
      OneLayer("type: LRN lrn_param { local_size: 3 alpha: 9 norm_region: WITHIN_CHANNEL }", &row)
          .Forward(),
      {1, 2, 3, 4}, {5, 14, 29, 25});
}

}  // namespace
}  // namespace nn
