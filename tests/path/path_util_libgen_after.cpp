#include "kovabackup/path_util.h"

#include <libgen.h>

#include "tests/path/path_util_libgen_calls.h"

PathUtilLibgen::Caller PathUtilLibgen::callerAfter() {
  return calls();
}
