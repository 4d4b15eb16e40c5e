#include "nn/filler.h"

#include <gtest/gtest.h>

#include <cmath>
#include <memory>

namespace nn {
namespace {

FillerParameter Param(const std::string& type) {
  FillerParameter param;
  param.set_type(type);
  return param;
}

void Fill(const FillerParameter& param, Blob<float>* blob) {
  std::unique_ptr<Filler<float>> filler(GetFiller<float>(param));
  filler->Fill(blob);
}

TEST(FillerTest, EachTypeFillsWithinItsLaw) {
  Blob<float> blob(2, 3, 4, 5);

  FillerParameter constant = Param("constant");
  constant.set_value(2.5f);
  Fill(constant, &blob);
  for (int i = 0; i < blob.count(); ++i) {
    ASSERT_EQ(blob.cpu_data()[i], 2.5f);
  }
  Fill(FillerParameter(), &blob);
  EXPECT_EQ(blob.cpu_data()[7], 0.0f) << "the default filler gives zeros";

  FillerParameter uniform = Param("uniform");
  uniform.set_min(-3.0f);
  uniform.set_max(-2.0f);
  Fill(uniform, &blob);
  for (int i = 0; i < blob.count(); ++i) {
    ASSERT_GE(blob.cpu_data()[i], -3.0f);
    ASSERT_LE(blob.cpu_data()[i], -2.0f);
  }

  Fill(Param("positive_unitball"), &blob);
  for (int n = 0; n < 2; ++n) {
    float sum = 0;
    for (int j = 0; j < 60; ++j) {
      ASSERT_GT(blob.cpu_data()[n * 60 + j], 0.0f);
      sum += blob.cpu_data()[n * 60 + j];
    }
    EXPECT_NEAR(sum, 1.0f, 1e-5);
  }

  // fan_in = 60 per num.
  Fill(Param("xavier"), &blob);
  const float bound = std::sqrt(3.0f / 60.0f);
  for (int i = 0; i < blob.count(); ++i) {
    ASSERT_LE(std::fabs(blob.cpu_data()[i]), bound);
  }
  Blob<float> column(6, 1, 1, 1);
  Fill(Param("xavier"), &column);
  for (int i = 0; i < 6; ++i) {
    ASSERT_LE(std::fabs(column.cpu_data()[i]), std::sqrt(3.0f));
  }

  // The default sparsity -1 means no mask and no shape demand.
  FillerParameter gaussian = Param("gaussian");
  gaussian.set_mean(10.0f);
  gaussian.set_std(0.1f);
  Fill(gaussian, &blob);
  EXPECT_NEAR(blob.cpu_data()[0], 10.0f, 1.0f);
}

TEST(FillerTest, SparseGaussianMasksAMatrix) {
  Blob<float> matrix(1, 1, 50, 8);
  FillerParameter none = Param("gaussian");
  none.set_sparse(0);
  Fill(none, &matrix);
  for (int i = 0; i < matrix.count(); ++i) {
    ASSERT_EQ(matrix.cpu_data()[i], 0.0f);
  }

  FillerParameter all = Param("gaussian");
  all.set_mean(5.0f);
  all.set_sparse(50);  // p = 50 / height = 1
  Fill(all, &matrix);
  for (int i = 0; i < matrix.count(); ++i) {
    ASSERT_NE(matrix.cpu_data()[i], 0.0f);
  }
}

TEST(FillerDeathTest, BadParametersEndTheProcessWithTheirWords) {
  Blob<float> blob(2, 1, 2, 2);
  EXPECT_DEATH(Fill(Param("Gaussian"), &blob), "Check failed: false Unknown filler name: Gaussian");

  FillerParameter sparse = Param("constant");
  sparse.set_sparse(3);
  EXPECT_DEATH(Fill(sparse, &blob),
               "Check failed: this->filler_param_.sparse\\(\\) == -1 .*Sparsity not supported by "
               "this Filler.");
  sparse.set_type("xavier");
  EXPECT_DEATH(Fill(sparse, &blob), "Sparsity not supported by this Filler.");

  FillerParameter gaussian = Param("gaussian");
  gaussian.set_sparse(-2);
  EXPECT_DEATH(Fill(gaussian, &blob), "Check failed: sparse >= -1 ");
  gaussian.set_sparse(1);
  EXPECT_DEATH(Fill(gaussian, &blob), "Check failed: blob->num\\(\\) == 1 ");

  // An empty blob: the data pointer is asked first by some, the count by others.
  Blob<float> empty(0, 1, 1, 1);
  EXPECT_DEATH(Fill(Param("constant"), &empty), "Check failed: data_ ");
  EXPECT_DEATH(Fill(Param("uniform"), &empty), "Check failed: blob->count\\(\\) ");
  EXPECT_DEATH(Fill(Param("xavier"), &empty), "Check failed: blob->count\\(\\) ");
}

}  // namespace
}  // namespace nn
