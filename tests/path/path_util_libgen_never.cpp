#include "kovabackup/path_util.h"

#include "tests/path/path_util_libgen_calls.h"

PathUtilLibgen::Caller PathUtilLibgen::callerNever() {
  return calls();
}
