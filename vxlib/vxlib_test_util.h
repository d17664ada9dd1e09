#pragma once

#include <utility>

#include "VXException.h"

// The code of the CVXException* that `f` throws (deleting it), or 0 when it throws none.
template <typename F>
unsigned ThrownCode(F&& f) {
  try {
    std::forward<F>(f)();
  } catch (CVXException* e) {
    unsigned code = e->GetCode();
    delete e;
    return code;
  }
  return 0;
}
