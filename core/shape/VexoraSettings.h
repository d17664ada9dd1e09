#pragma once

#include <cstdint>
#include <string>

#include "VXBase.h"
#include "VXColor.h"

// Settings of the comparisons of CShape: the method, the cut-off, the colour query and the cell
// mask. Spare, Limit, Option and Percent are kept for the client; no operation of the library
// reads them.
class CVexoraSettings : public CVXBase {
 public:
  struct SData {
    SData();

    uint32_t Method = 2;         // Compare: 1 duplicates, 2 quick, 3 full; CompareColor: 6 and 7
    double MaxDifference = 3.0;  // a comparison stops above this value
    double Spare = 0;
    double Limit = 1000.0;
    uint32_t Option = 1;
    uint32_t Percent = 100;
    std::string Name = "Default";
    ShapeColorInfo Colors[20][20];  // colour query of CompareColor, cell order x * 20 + y
    uint32_t ColorTolerance = 50;
    uint32_t LumaWeight = 35;   // percent weight of C1
    uint32_t ColorWeight = 45;  // percent weight of the colour against the shape
    uint8_t UseMask = 0;        // Mask is in force
    uint8_t Mask[400];          // cell weights in percent

    // Field by field in declaration order, Name included.
    bool operator==(const SData& other) const;
  };

  CVexoraSettings() = default;
  explicit CVexoraSettings(const SData& data) : data_(data) {}
  CVexoraSettings(const CVexoraSettings& other) = default;
  CVexoraSettings& operator=(const CVexoraSettings& other) = default;
  ~CVexoraSettings() override = default;

  bool operator==(const CVexoraSettings& other) const { return data_ == other.data_; }

  SData& Data() { return data_; }
  const SData& Data() const { return data_; }

 private:
  SData data_;
};
