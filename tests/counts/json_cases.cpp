// JSON text, and the white space and the lines of section files. The size is the number of bytes
// unless a comment says otherwise.

#include "base/json_text.h"
#include "base/section_grammar.h"
#include "base/trim.h"

#include "tests/counts/counted.h"

namespace KovaCounts {
namespace {

namespace Grammar = KOVA::Base::SectionGrammar;
using KOVA::Base::JsonText::fromText;
using KOVA::Base::JsonText::toText;

void bothWays(const Json::Value &value) {
  const std::string text = toText(value);
  count([&] {
    Json::Value back;
    return fromText(text, back) && toText(back) == text;
  });
}

void readText(const std::string &text) {
  count([&] {
    Json::Value value;
    return fromText(text, value);
  });
}

void writeValue(const Json::Value &value, std::size_t least) {
  count([&] { return toText(value).size() >= least; });
}

// The size is the number of members.
Json::Value makeObject(std::size_t members) {
  Json::Value object(Json::objectValue);
  for (std::size_t i = 0; i < members; ++i) {
    object["key" + std::to_string(100000 + i)] = static_cast<int>(i);
  }
  return object;
}

void readObject(std::size_t members) {
  readText(toText(makeObject(members)));
}
void writeObject(std::size_t members) {
  writeValue(makeObject(members), members);
}

void readString(std::size_t bytes) {
  readText('"' + std::string(bytes, 'x') + '"');
}
void writeString(std::size_t bytes) {
  writeValue(std::string(bytes, 'x'), bytes);
}

void escapes(std::size_t bytes) {
  bothWays(repeated("\n\"\\\x01", bytes / 4));
}

void rawBytes(std::size_t bytes) {
  bothWays(repeated("\xff\xc3\xa4", bytes / 3));
}

// The size is the number of entries.
void integers(std::size_t entries) {
  Json::Value list(Json::arrayValue);
  for (std::size_t i = 0; i < entries; ++i) {
    list.append(static_cast<int>(i * 7919));
  }
  bothWays(list);
}

// The size is the number of entries.
void reals(std::size_t entries) {
  Json::Value list(Json::arrayValue);
  for (std::size_t i = 0; i < entries; ++i) {
    list.append(static_cast<double>(i) + 0.1);
  }
  bothWays(list);
}

// The size is the depth.
void nested(std::size_t depth) {
  readText(std::string(depth, '[') + std::string(depth, ']'));
}

// The size is the depth.
void nestedTooDeep(std::size_t depth) {
  const std::string text(depth, '[');
  count([&] {
    Json::Value value;
    return !fromText(text, value);
  });
}

void trimmed(std::size_t bytes) {
  const std::string white = repeated(" \t\r\n", bytes / 4);
  const std::string text = white + "x" + white + "y" + white;
  count([&] {
    return KOVA::Base::trim(text).size() == white.size() + 2 && KOVA::Base::trim(white).empty();
  });
}

void parsedLine(const std::string &line, Grammar::LineKind kind) {
  count([&] { return Grammar::parse(line).kind == kind; });
}

void optionLine(std::size_t bytes) {
  const std::string white(bytes / 4, ' ');
  parsedLine(white + "key" + white + "=" + white + "value" + white + "\n",
             Grammar::LineKind::Option);
}
void headerLine(std::size_t bytes) {
  parsedLine("[" + std::string(bytes, ']') + "]\n", Grammar::LineKind::Header);
}
void nulLine(std::size_t bytes) {
  parsedLine(std::string(bytes, '\0') + "\n", Grammar::LineKind::Other);
}

// The size is the number of lines.
void lines(std::size_t number) {
  const std::string text = repeated("[task]\nkey=value\n", number / 2);
  count([&] {
    std::string_view rest = text;
    std::size_t options = 0;
    while (!rest.empty()) {
      if (Grammar::parse(Grammar::takeLine(rest)).kind == Grammar::LineKind::Option) {
        ++options;
      }
    }
    return options == number / 2;
  });
}

constexpr Case kCases[] = {
    {"JsonText.read.string", readString, {10, 4096}, 16384},
    {"JsonText.write.string", writeString, {10, 4096}, 16384},
    {"JsonText.read.object", readObject, {10, 500}, 500, kLinearLog},
    {"JsonText.write.object", writeObject, {10, 500}, 500},
    {"JsonText.escapes", escapes, {4096}, 4096},
    {"JsonText.rawBytes", rawBytes, {4095}, 4095},
    {"JsonText.integers", integers, {10, 500}, 500, kLinearLog},
    {"JsonText.reals", reals, {10, 250}, 250, kLinearLog},
    {"JsonText.nested", nested, {10}, 240},
    {"JsonText.nestedTooDeep", nestedTooDeep, {2000}, 2000, kConstant},
    {"trim", trimmed, {16, 1024}, 16384},
    {"SectionGrammar.parse.option", optionLine, {16, 1024}, 16384},
    {"SectionGrammar.parse.header", headerLine, {16, 1024}, 16384},
    {"SectionGrammar.parse.nuls", nulLine, {16, 1024}, 16384},
    {"SectionGrammar.lines", lines, {1000}, 1000},
};

} // namespace

Cases jsonCases() {
  return casesOf(kCases);
}

} // namespace KovaCounts
