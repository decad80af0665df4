// Templates with {{name}} placeholders: the scan, and the values from maps and JSON objects.

#include "kovabackup/string_util.h"

#include "base/json_text.h"
#include "string/name_index.h"

#include <cstring>
#include <optional>
#include <string_view>
#include <typeinfo>

namespace KOVA::Backup {
namespace {

// The library exports the type information of the mappers, as programs that are linked to it may
// refer to it. The compiler emits it only where it is used, and no other place here uses it.
[[gnu::used]] const std::type_info *const exportedTypes[] = {&typeid(_VarsMapperJson),
                                                             &typeid(_VarsMapperMapString)};

constexpr std::string_view kOpen = "{{";
constexpr std::string_view kClose = "}}";
constexpr std::size_t kNone = std::string_view::npos;

// A text that is put together from many short pieces. They are gathered in a buffer, which costs
// much less than appending each to a string.
class Pieces {
public:
  // expected is a guess at the length of the text, which saves copying it when it grows.
  explicit Pieces(std::size_t expected) : expected_(expected) {}

  void append(std::string_view piece) {
    if (piece.size() > sizeof buffer_ - used_) {
      flush();
      if (piece.size() > sizeof buffer_) {
        text_ += piece;
        return;
      }
    }
    used_ += piece.copy(buffer_ + used_, piece.size());
  }

  std::string take() {
    text_.append(buffer_, used_);
    return std::move(text_);
  }

private:
  void flush() {
    text_.reserve(expected_);
    text_.append(buffer_, used_);
    used_ = 0;
  }

  std::size_t expected_;
  std::string text_;
  std::size_t used_ = 0;
  char buffer_[4096];
};

// The position of the last "}}". memrchr(3) is many times faster than rfind.
std::size_t findLastClose(std::string_view text) {
  for (;;) {
    const void *const brace = ::memrchr(text.data(), '}', text.size());
    if (brace == nullptr) {
      return kNone;
    }
    const auto at = static_cast<std::size_t>(static_cast<const char *>(brace) - text.data());
    if (at > 0 && text[at - 1] == '}') {
      return at - 1;
    }
    text = text.substr(0, at);
  }
}

// Copies text, and calls appendValue(name, pieces) for each placeholder, in order, to append what
// takes its place.
template <typename AppendValue>
std::string expand(std::string_view text, AppendValue appendValue) {
  const std::size_t lastClose = findLastClose(text);
  if (lastClose == kNone) {
    return std::string(text);
  }
  const std::string_view closed = text.substr(0, lastClose); // what is opened here is closed
  Pieces pieces(text.size() + text.size() / 4);
  std::size_t copied = 0;
  std::size_t open = closed.find(kOpen);
  while (open != kNone) {
    std::size_t close = open + 1;
    for (; text[close] != '}' || text[close + 1] != '}'; ++close) {
      if (text[close] == '{' && text[close + 1] == '{') {
        open = close; // the last one opens the placeholder
      }
    }
    pieces.append(text.substr(copied, open - copied));
    appendValue(text.substr(open + kOpen.size(), close - open - kOpen.size()), pieces);
    copied = close + kClose.size();
    open = closed.find(kOpen, copied);
  }
  pieces.append(text.substr(copied));
  return pieces.take();
}

// Looks up the names of a text in vars: in vars itself at first, and in an index of it when the
// text turns out to have many placeholders.
template <typename Vars>
class Lookup {
public:
  Lookup(const Vars &vars, std::string_view text) : vars_(vars), text_(text) {}

  typename Vars::Value operator()(std::string_view name) {
    if (!index_ && indexPays(static_cast<std::size_t>(name.data() - text_.data()))) {
      index_.emplace(vars_.size());
      vars_.addTo(*index_);
    }
    return index_ ? index_->find(name, vars_) : vars_(name);
  }

private:
  // An index costs as much as looking up every other name. It pays if the text continues as it did
  // up to here. The bytes added to the position keep a dense start from counting too much.
  bool indexPays(std::size_t position) {
    constexpr std::size_t kSteady = 100;
    ++lookups_;
    return text_.size() / (position + kSteady) * lookups_ > vars_.size() / 2;
  }

  const Vars &vars_;
  std::string_view text_;
  std::size_t lookups_ = 0;
  std::optional<NameIndex<typename Vars::Value>> index_;
};

class MapVars {
public:
  using Value = std::string_view;

  explicit MapVars(const std::map<std::string, std::string> &vars) : vars_(vars) {}

  std::size_t size() const { return vars_.size(); }

  Value operator()(std::string_view name) const {
    const auto found = vars_.find(std::string(name));
    return found == vars_.end() ? Value() : found->second;
  }

  void addTo(NameIndex<Value> &index) const {
    for (const auto &[name, value] : vars_) {
      index.add(name, value);
    }
  }

private:
  const std::map<std::string, std::string> &vars_;
};

// Whether a member is a string or null, whose text without asJson is just its bytes or empty.
bool getBareText(const Json::Value &member, std::string_view &text) {
  const char *begin = nullptr;
  const char *end = nullptr;
  if (!member.getString(&begin, &end)) {
    return member.isNull();
  }
  text = {begin, static_cast<std::size_t>(end - begin)};
  return true;
}

class JsonVars {
public:
  struct Value {
    std::string_view text;
    const Json::Value *json = nullptr; // the member whose JSON text is to be made
  };

  JsonVars(const Json::Value &vars, bool asJson) : vars_(vars), asJson_(asJson) {}

  std::size_t size() const { return vars_.size(); }

  Value operator()(std::string_view name) const {
    const Json::Value *member = vars_.find(name.data(), name.data() + name.size());
    return member == nullptr ? Value() : valueOf(*member);
  }

  void addTo(NameIndex<Value> &index) const {
    const auto end = vars_.end();
    for (auto member = vars_.begin(); member != end; ++member) {
      const char *nameEnd = nullptr;
      const char *const name = member.memberName(&nameEnd);
      index.add({name, static_cast<std::size_t>(nameEnd - name)}, valueOf(*member));
    }
  }

private:
  Value valueOf(const Json::Value &member) const {
    Value value;
    if (asJson_ || !getBareText(member, value.text)) {
      value.json = &member;
    }
    return value;
  }

  const Json::Value &vars_;
  bool asJson_;
};

} // namespace

bool _VarsMapperMapString::operator()(const std::string &name, std::string &value) const {
  const auto found = vars_.find(name);
  if (found == vars_.end()) {
    return false;
  }
  value = found->second;
  return true;
}

bool _VarsMapperJson::operator()(const std::string &name, std::string &value) const {
  // The JSON library throws when a value that is not an object is asked for a member.
  if (!vars_.isObject()) {
    return false;
  }
  const Json::Value *member = vars_.find(name.data(), name.data() + name.size());
  if (member == nullptr) {
    return false;
  }
  std::string_view text;
  if (!asJson_ && getBareText(*member, text)) {
    value = text;
  } else {
    value = Base::JsonText::toText(*member);
  }
  return true;
}

// NOLINTBEGIN(performance-unnecessary-value-param): the interface takes the mapper by value
std::string
replaceMustache(const std::string &text,
                boost::function<bool(const std::string &name, std::string &value)> mapper) {
  // NOLINTEND(performance-unnecessary-value-param)
  return expand(text, [&mapper](std::string_view name, Pieces &pieces) {
    std::string value;
    if (mapper(std::string(name), value)) {
      pieces.append(value);
    }
  });
}

std::string replaceMustache(const std::string &text,
                            const std::map<std::string, std::string> &vars) {
  const MapVars mapVars(vars);
  Lookup lookup(mapVars, text);
  return expand(text, [&](std::string_view name, Pieces &pieces) { pieces.append(lookup(name)); });
}

std::string replaceMustache(const std::string &text, const Json::Value &vars, bool asJson) {
  if (!vars.isObject()) {
    return expand(text, [](std::string_view, Pieces &) {});
  }
  const JsonVars jsonVars(vars, asJson);
  Lookup lookup(jsonVars, text);
  return expand(text, [&](std::string_view name, Pieces &pieces) {
    const JsonVars::Value value = lookup(name);
    if (value.json == nullptr) {
      pieces.append(value.text);
    } else {
      pieces.append(Base::JsonText::toText(*value.json));
    }
  });
}

} // namespace KOVA::Backup
