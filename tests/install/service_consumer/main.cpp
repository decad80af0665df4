// Uses both libraries: a tree is walked with a filter of the first one, and a command counts it.
#include <kovabackup/path_filter.h>
#include <kovabackup/service/cancel.h>
#include <kovabackup/service/command.h>
#include <kovabackup/service/tree_walk.h>

#include <iostream>
#include <string>

using namespace KOVA::Backup;
using namespace KOVA::Backup::Service;

int main() {
  PathFilter filter;
  filter.addExcludePattern("/etc/**");
  filter.addIncludePattern("/etc/passwd");
  TreeWalk walk("/etc", filter);
  std::string kept;
  for (WalkEntry entry; walk.next(entry);) {
    kept += entry.kept && entry.path != "/etc" ? entry.path + "\n" : "";
  }
  if (kept != "/etc/passwd\n") {
    return 1;
  }
  Command count({"/usr/bin/wc", "-l"});
  count.input(kept).capture(Stream::Out, 100);
  const Result counted = count.run();
  if (!counted.ok() || counted.out.text != "1\n") {
    return 2;
  }
  Cancel cancel;
  cancel.request();
  if (count.cancelledBy(cancel).run().end != Result::End::NotStarted) {
    return 3;
  }
  std::cout << "the installed library works\n";
  return 0;
}
