#pragma once

#include <gtest/gtest.h>

#include <optional>

#include "support/picture_maker.h"

namespace zt::test_support {

// A synthetic picture for a test; the test fails when libvips cannot make it. (The picture
// maker itself stays free of GoogleTest: the benchmarks build it without the tests.)
inline Data picture(const PictureRecipe& recipe) {
  std::optional<Data> bytes = makePicture(recipe);
  EXPECT_TRUE(bytes) << "libvips could not make the test picture";
  return bytes.value_or(Data{});
}

}  // namespace zt::test_support
