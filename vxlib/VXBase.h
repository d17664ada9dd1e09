#pragma once

// Root of the library's objects. It carries no data; it gives every object a virtual destructor
// so that owners may delete through a base pointer.
class CVXBase {
 public:
  CVXBase() = default;
  CVXBase(const CVXBase&) = default;
  CVXBase& operator=(const CVXBase&) = default;
  virtual ~CVXBase() = default;
};
