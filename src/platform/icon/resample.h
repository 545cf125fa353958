// Scaling pictures for the icon renderer: area averaging when shrinking, bilinear interpolation
// when enlarging, both on premultiplied alpha so that transparent pixels lend no colour.
#pragma once

#include "platform/icon/image.h"

namespace appsync::icon {

// A rectangle of the source in pixel units; fractional edges are honoured exactly.
struct SourceRect {
  double x = 0;
  double y = 0;
  double width = 0;
  double height = 0;
};

// Maps `rect` of `source` onto an image of outWidth x outHeight. Each axis is handled on its
// own: where it shrinks, every output pixel is the average of the source area it covers
// (fractional coverage weighted exactly); where it grows, output pixels are interpolated
// linearly between the nearest source pixel centres, clamped at the edges. An empty source or
// a non-positive output size yields a transparent image of the requested size (or an empty one).
Image resample(const Image& source, const SourceRect& rect, int outWidth, int outHeight);

// Scales `source` to fill a size x size square: the shorter side spans the square and the
// longer side is cropped equally on both ends, so the picture keeps its aspect ratio and its
// centre.
Image scaleToSquare(const Image& source, int size);

}  // namespace appsync::icon
