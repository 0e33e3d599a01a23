#include "include/mavoea.h"
