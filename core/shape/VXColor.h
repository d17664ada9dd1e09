#pragma once

#include <cstdint>

// One pixel as the host hands it in: four bytes, red first. Byte 3 is alpha or a mark of the
// host's and is never read by the feature code.
union SVXColor {
  struct {
    uint8_t R;
    uint8_t G;
    uint8_t B;
    uint8_t A;
  };
  uint8_t Bytes[4];
  uint32_t Value;
};
static_assert(sizeof(SVXColor) == 4);

// A colour of a colour query cell: the RGB the user chose, its opponent-space conversion and the
// share in percent it should cover. 7 bytes, no padding.
struct ShapeColorInfo {
  uint8_t R;
  uint8_t G;
  uint8_t B;
  uint8_t C1;
  uint8_t C2;
  uint8_t C3;
  uint8_t Percent;
};
static_assert(sizeof(ShapeColorInfo) == 7);

// The input form of ShapeColorInfo: the same 7 bytes, C1 to C3 not yet computed.
struct SColPercMatchInfo : ShapeColorInfo {};
static_assert(sizeof(SColPercMatchInfo) == 7);

// Opponent colour space of the feature record, integer arithmetic with truncation:
//   C1 = (r + g + b) / 3            brightness
//   C2 = (r - b + 255) / 2          blue to red
//   C3 = (r + 2 * (255 - g) + b) / 4  green to magenta
void RGB2C3(SVXColor color, unsigned char& c1, unsigned char& c2, unsigned char& c3);
void RGB2C3(ShapeColorInfo& color, unsigned char& c1, unsigned char& c2, unsigned char& c3);

// Inline core of the conversion, shared by every caller that already holds the three bytes.
inline void RGB2C3(unsigned r, unsigned g, unsigned b, unsigned char& c1, unsigned char& c2,
                   unsigned char& c3) {
  c1 = static_cast<unsigned char>((r + g + b) / 3);
  c2 = static_cast<unsigned char>((r - b + 255) / 2);
  c3 = static_cast<unsigned char>((r + 2 * (255 - g) + b) / 4);
}

// r, g, b in 0..255 in; h in degrees 0..360, s and v in 0..1 out.
void RGBtoHSV(double r, double g, double b, double& h, double& s, double& v);
// h in degrees, s and v in 0..1 in; r, g, b in 0..1 out (not 0..255: the two are not inverse).
void HSVtoRGB(double h, double s, double v, double& r, double& g, double& b);
