#include "VXColor.h"
