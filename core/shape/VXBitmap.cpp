#include "VXBitmap.h"
