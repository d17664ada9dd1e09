#include "Shape.h"
