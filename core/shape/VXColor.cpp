#include "VXColor.h"

#include <algorithm>
#include <cmath>

void RGB2C3(SVXColor color, unsigned char& c1, unsigned char& c2, unsigned char& c3) {
  RGB2C3(color.R, color.G, color.B, c1, c2, c3);
}

void RGB2C3(ShapeColorInfo& color, unsigned char& c1, unsigned char& c2, unsigned char& c3) {
  RGB2C3(color.R, color.G, color.B, c1, c2, c3);
}

void RGBtoHSV(double r, double g, double b, double& h, double& s, double& v) {
  const double kScale = 0.00392156862745098;  // 1 / 255
  r *= kScale;
  g *= kScale;
  b *= kScale;
  const double max = std::max({r, g, b});
  const double min = std::min({r, g, b});
  const double d = max - min;
  v = max;
  if (d == 0 || max == 0) {
    h = s = 0;
    return;
  }
  s = d / max;
  if (r == max) {
    h = (g - b) / d;
  } else if (g == max) {
    h = 2 + (b - r) / d;
  } else {
    h = 4 + (r - g) / d;
  }
  h *= 60;
  if (h < 0) h += 360;
}

void HSVtoRGB(double h, double s, double v, double& r, double& g, double& b) {
  if (s == 0) {
    r = g = b = v;
    return;
  }
  if (!std::isfinite(h)) h = 0;
  if (std::fabs(h) > 1e6) h = std::fmod(h, 360.0);  // keeps the sector index in int range
  h /= 60;
  const double sector = std::floor(h);
  const double f = h - sector;
  // h of 360 or more, or negative, wraps into the six sectors.
  const int index = static_cast<int>(sector - 6 * std::floor(sector / 6));
  const double p = v * (1 - s);
  const double q = v * (1 - s * f);
  const double t = v * (1 - s * (1 - f));
  switch (index) {
    case 0:
      r = v, g = t, b = p;
      break;
    case 1:
      r = q, g = v, b = p;
      break;
    case 2:
      r = p, g = v, b = t;
      break;
    case 3:
      r = p, g = q, b = v;
      break;
    case 4:
      r = t, g = p, b = v;
      break;
    default:
      r = v, g = p, b = q;
      break;
  }
}
