#include "WeightMatrix.h"
