#include "VexoraSettings.h"

#include <cstring>

CVexoraSettings::SData::SData() {
  std::memset(Colors, 0, sizeof Colors);
  for (auto& column : Colors) {
    for (ShapeColorInfo& c : column) c.Percent = 1;
  }
  std::memset(Mask, 100, sizeof Mask);
}

bool CVexoraSettings::SData::operator==(const SData& other) const {
  return Method == other.Method && MaxDifference == other.MaxDifference && Spare == other.Spare &&
         Limit == other.Limit && Option == other.Option && Percent == other.Percent &&
         Name == other.Name && std::memcmp(Colors, other.Colors, sizeof Colors) == 0 &&
         ColorTolerance == other.ColorTolerance && LumaWeight == other.LumaWeight &&
         ColorWeight == other.ColorWeight && UseMask == other.UseMask &&
         std::memcmp(Mask, other.Mask, sizeof Mask) == 0;
}
