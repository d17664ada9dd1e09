#include "VXThumb.h"
