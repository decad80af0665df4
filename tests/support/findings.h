#ifndef KOVABACKUP_TESTS_SUPPORT_FINDINGS_H
#define KOVABACKUP_TESTS_SUPPORT_FINDINGS_H

#include <string>
#include <vector>

namespace KovaTest {

/// Collects what is wrong with a run.
class Findings {
public:
  void expect(bool holds, const std::string &what) {
    if (!holds) {
      list_.push_back(what);
    }
  }
  const std::vector<std::string> &list() const { return list_; }

private:
  std::vector<std::string> list_;
};

} // namespace KovaTest

#endif
