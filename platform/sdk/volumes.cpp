#include "kovaplatform/kovasdk.h"
