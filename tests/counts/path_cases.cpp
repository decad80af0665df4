// The algebra of paths. The size is the number of components unless a comment says otherwise.
//
// Path::token reads the path up to its component. One call is linear; calls for all components of a
// path together are quadratic, and Path::split is the linear way to all of them.

#include "kovabackup/path_kova.h"
#include "kovabackup/path_util.h"

#include "tests/counts/counted.h"

#include <unistd.h>

namespace KovaCounts {
namespace {

using namespace KOVA::Backup;
using Parts = std::vector<std::string>;

Parts makeParts(std::size_t components) {
  Parts parts = {"/"};
  for (std::size_t i = 1; i < components; ++i) {
    parts.push_back("folder" + std::to_string(1000000 + i));
  }
  return parts;
}

std::string makePath(std::size_t components) {
  return Path::join(makeParts(components));
}

void joinTwo(std::size_t components) {
  const std::string head = makePath(components / 2);
  const std::string tail = makePath(components - components / 2);
  count([&] { return Path::join(head, tail).size() == head.size() + tail.size(); });
}

void joinSeven(std::size_t components) {
  const std::string part = makePath(components / 7 + 1);
  count([&] {
    return Path::join(part, part, part, part, part, part, part).size() == part.size() * 7;
  });
}

void joinAll(std::size_t components) {
  const Parts parts = makeParts(components);
  count([&] { return !Path::join(parts).empty(); });
}

// The size is the number of slashes at each side.
void joinSlashes(std::size_t slashes) {
  const std::string head = "/a" + std::string(slashes, '/');
  const std::string tail = std::string(slashes, '/') + "b";
  count([&] { return Path::join(head, tail) == "/a/b"; });
}

void split(std::size_t components) {
  const std::string path = makePath(components);
  count([&] {
    Parts parts;
    return Path::split(path, parts) && parts.size() == components;
  });
}

// The size is the number of slashes.
void splitSlashes(std::size_t slashes) {
  const std::string path = "a" + std::string(slashes, '/');
  count([&] {
    Parts parts;
    return Path::split(path, parts) && parts.size() == 1;
  });
}

void lastToken(std::size_t components) {
  const std::string path = makePath(components);
  const std::string last = makeParts(components).back();
  count([&] { return Path::token(path, static_cast<unsigned>(components - 1)) == last; });
}

void dirname(std::size_t components) {
  const std::string path = makePath(components);
  const std::string folder = makePath(components - 1);
  count([&] { return Path::dirname(path) == folder; });
}

void basename(std::size_t components) {
  const std::string path = makePath(components);
  const std::string last = makeParts(components).back();
  count([&] { return Path::basename(path) == last; });
}

// The size is the number of slashes at the end.
void basenameSlashes(std::size_t slashes) {
  const std::string path = "/a" + std::string(slashes, '/');
  count([&] { return Path::basename(path) == "a" && Path::dirname(path) == "/"; });
}

void common(std::size_t components) {
  const std::string one = makePath(components) + "/one";
  const std::string other = makePath(components) + "/other";
  const std::string shared = makePath(components);
  count([&] { return Path::common(one, other) == shared; });
}

void relative(std::size_t components) {
  const std::string base = makePath(components);
  const std::string path = base + base;
  count([&] { return Path::relative(path, base) == base.substr(1); });
}

// No function resolves ".."; they are components like any other.
void dots(std::size_t components) {
  const std::string path = "/" + repeated("../", components) + "a";
  const std::string base = "/" + repeated("../", components / 2);
  count([&] {
    Parts parts;
    return Path::relative(path, base).size() == path.size() - base.size() &&
           Path::join(path, base).size() == path.size() + base.size() && Path::split(path, parts) &&
           parts.size() == components + 2;
  });
}

void absPath(std::size_t components) {
  require(::chdir("/") == 0, "the working folder");
  const std::string path = makePath(components);
  const std::string below = path.substr(1);
  count([&] { return Path::absPath(below) == path; });
}

void shareName(std::size_t components) {
  const std::string path = makePath(components);
  count([&] {
    return ConfigPath::shareName(path) == "folder1000001" &&
           ConfigPath::shareRelativePath(path).size() == path.size() - 15;
  });
}

// Names that only resemble the one that is searched.
void eaDir(std::size_t components) {
  const std::string path = repeated("/@eaDi/@eaDirs", components / 2);
  count([&] { return !Path::isInKovaEaDir(path); });
}

constexpr Case kCases[] = {
    {"Path.join.two", joinTwo, {4, 64}, 4096},
    {"Path.join.seven", joinSeven, {7, 64}, 4096},
    {"Path.join.all", joinAll, {4, 64}, 2048},
    {"Path.join.slashes", joinSlashes, {64}, 4096},
    {"Path.split", split, {4, 64}, 2048},
    {"Path.split.slashes", splitSlashes, {64}, 4096},
    {"Path.token.last", lastToken, {4, 64}, 2048},
    {"Path.dirname", dirname, {4, 64}, 2048},
    {"Path.basename", basename, {4, 64}, 2048},
    {"Path.basename.slashes", basenameSlashes, {64}, 4096},
    {"Path.common", common, {4, 64}, 2048},
    {"Path.relative", relative, {4, 64}, 4096},
    {"Path.dots", dots, {64}, 2048},
    {"Path.absPath", absPath, {4, 64}, 4096},
    {"Path.isInKovaEaDir", eaDir, {4, 64}, 4096},
    {"ConfigPath.share", shareName, {4, 64}, 4096},
};

} // namespace

Cases pathCases() {
  return casesOf(kCases);
}

} // namespace KovaCounts
