#include "kovaplatform/kovanetsdk.h"
