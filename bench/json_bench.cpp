// The options of a map in memory and as JSON text: set, read, copied, written and parsed. Raced
// against bare jsoncpp, against filling its value by hand, and against RapidJSON. Every run checks
// its result.

#include "kovabackup/option_map.h"

#include "bench/race.h"

#include <benchmark/benchmark.h>
#include <json/reader.h>
#include <json/writer.h>
#include <list>
#include <memory>
#include <rapidjson/document.h>
#include <rapidjson/stringbuffer.h>
#include <rapidjson/writer.h>
#include <sstream>
#include <string>
#include <string_view>
#include <vector>

namespace {

using KOVA::Backup::OptionMap;
using KovaBench::Race;
using KovaBench::rounds;
using Texts = std::list<std::string>;

const Texts kFolders = {"/volume1/photo", "/volume1/music", "/volume2/homes/admin"};

// The options of a task: half of them texts, the others numbers, flags and lists of texts.
enum class Kind { Text, Number, Flag, List };
struct Option {
  std::string key;
  Kind kind = Kind::Text;
  std::string text;
  int number = 0;
};

Kind kindOf(std::int64_t number) {
  constexpr Kind kKinds[] = {Kind::Text, Kind::Number, Kind::Text, Kind::Flag,
                             Kind::Text, Kind::Number, Kind::Text, Kind::List};
  return kKinds[static_cast<std::size_t>(number) % std::size(kKinds)];
}

std::vector<Option> makeOptions(std::int64_t count) {
  std::vector<Option> options;
  for (std::int64_t i = 0; i < count; ++i) {
    const std::string number = std::to_string(1000 + i); // keys of one length are in map order
    options.push_back(
        {"option_" + number, kindOf(i), "the text of option " + number, static_cast<int>(i) * 37});
  }
  return options;
}

void fill(OptionMap &map, const std::vector<Option> &options) {
  for (const Option &option : options) {
    switch (option.kind) {
    case Kind::Text:
      map.optSet(option.key, option.text);
      break;
    case Kind::Number:
      map.optSet(option.key, option.number);
      break;
    case Kind::Flag:
      map.optSet(option.key, option.number % 2 == 0);
      break;
    case Kind::List:
      map.optSet(option.key, kFolders);
      break;
    }
  }
}

Json::Value listByHand(const Texts &texts) {
  Json::Value list(Json::arrayValue);
  for (const std::string &text : texts) {
    list.append(text);
  }
  return list;
}

Json::Value fillByHand(const std::vector<Option> &options) {
  Json::Value values(Json::objectValue);
  for (const Option &option : options) {
    switch (option.kind) {
    case Kind::Text:
      values[option.key] = option.text;
      break;
    case Kind::Number:
      values[option.key] = option.number;
      break;
    case Kind::Flag:
      values[option.key] = option.number % 2 == 0;
      break;
    case Kind::List:
      values[option.key] = listByHand(kFolders);
      break;
    }
  }
  return values;
}

std::string writeLibrary(Json::StreamWriter &writer, const Json::Value &values) {
  std::ostringstream out;
  (void)writer.write(values, &out);
  return out.str();
}

std::unique_ptr<Json::StreamWriter> libraryWriter() {
  Json::StreamWriterBuilder builder;
  builder["indentation"] = "";
  builder["emitUTF8"] = true;
  return std::unique_ptr<Json::StreamWriter>(builder.newStreamWriter());
}

std::unique_ptr<Json::CharReader> libraryReader() {
  Json::CharReaderBuilder builder;
  builder["collectComments"] = false;
  builder["failIfExtra"] = true;
  return std::unique_ptr<Json::CharReader>(builder.newCharReader());
}

bool readLibrary(Json::CharReader &reader, const std::string &text, Json::Value &values) {
  return reader.parse(text.data(), text.data() + text.size(), &values, nullptr);
}

std::string_view writeRapid(const rapidjson::Document &document, rapidjson::StringBuffer &buffer) {
  buffer.Clear();
  rapidjson::Writer<rapidjson::StringBuffer> writer(buffer);
  (void)document.Accept(writer);
  return {buffer.GetString(), buffer.GetSize()};
}

void writeJson(benchmark::State &state) {
  const std::vector<Option> options = makeOptions(state.range(0));
  OptionMap map;
  fill(map, options);
  const Json::Value values = fillByHand(options);
  const auto writer = libraryWriter();
  const std::string expected = writeLibrary(*writer, values);
  rapidjson::Document document;
  document.Parse(expected.c_str());
  rapidjson::StringBuffer buffer;
  Race(state, [&] { return map.optToJsonString() == expected; })
      .peer(
          "rapidjson", [&] { return writeRapid(document, buffer) == expected; }, 2.0)
      .peer("jsoncpp", [&] { return writeLibrary(*writer, values) == expected; })
      .run();
}
BENCHMARK(writeJson)->Arg(10)->Arg(100)->Arg(1000)->Apply(rounds);

// The new values replace the previous ones, which are released.
void readJson(benchmark::State &state) {
  const std::vector<Option> options = makeOptions(state.range(0));
  const Json::Value expected = fillByHand(options);
  const std::string text = writeLibrary(*libraryWriter(), expected);
  const auto count = static_cast<Json::ArrayIndex>(options.size());
  OptionMap map;
  if (!map.optLoadJsonString(text) || map.optToJsonString() != text) {
    state.SkipWithError("kova: another value");
    return;
  }
  Json::Value byHand;
  Json::Value parsed;
  const auto reader = libraryReader();
  Race(state, [&] { return map.optLoadJsonString(text); })
      .peer(
          "by_hand",
          [&] {
            Json::Value values = fillByHand(options);
            byHand.swap(values);
            return byHand.size() == count;
          },
          1.3)
      .peer("rapidjson",
            [&] {
              rapidjson::Document document;
              document.Parse(text.c_str(), text.size());
              return !document.HasParseError() && document.MemberCount() == count;
            })
      .peer("jsoncpp", [&] { return readLibrary(*reader, text, parsed) && parsed.size() == count; })
      .run();
}
BENCHMARK(readJson)->Arg(10)->Arg(100)->Arg(1000)->Apply(rounds);

// One option among twenty gets another value of its type.
template <typename Value, typename Convert>
void raceSet(benchmark::State &state, std::size_t at, const Value &value, Convert byHand) {
  const std::vector<Option> options = makeOptions(20);
  OptionMap map;
  fill(map, options);
  Json::Value values = fillByHand(options);
  const std::string &key = options[at].key;
  Race(state, [&] { return map.optSet(key, value); })
      .peer(
          "jsoncpp",
          [&] {
            values[key] = byHand(value);
            return true;
          },
          1.1)
      .run();
  std::ostringstream text;
  text << map;
  if (text.str() != writeLibrary(*libraryWriter(), values)) {
    state.SkipWithError("another value");
  }
}

template <typename Value>
const Value &same(const Value &value) {
  return value;
}

void setString(benchmark::State &state) {
  const std::string text(static_cast<std::size_t>(state.range(0)), 'x');
  raceSet(state, 12, text, same<std::string>);
}
BENCHMARK(setString)->Arg(8)->Arg(32)->Arg(1000)->Apply(rounds);

void setInt(benchmark::State &state) {
  raceSet(state, 13, 42, same<int>);
}
BENCHMARK(setInt)->Apply(rounds);

void setBool(benchmark::State &state) {
  raceSet(state, 11, true, same<bool>);
}
BENCHMARK(setBool)->Apply(rounds);

void setList(benchmark::State &state) {
  raceSet(state, 15, kFolders, listByHand);
}
BENCHMARK(setList)->Apply(rounds);

// A map of twenty options and its bare value.
struct Both {
  const std::vector<Option> options = makeOptions(20);
  OptionMap map;
  Json::Value values = fillByHand(options);

  Both() { fill(map, options); }
  const std::string &key(std::size_t at) const { return options[at].key; }
  const Json::Value *bare(std::size_t at) const {
    return values.find(key(at).data(), key(at).data() + key(at).size());
  }
};

void getString(benchmark::State &state) {
  const Both both;
  const std::string &expected = both.options[12].text;
  Race(state, [&] { return both.map.optString(both.key(12), "") == expected; })
      .peer(
          "jsoncpp", [&] { return both.bare(12)->asString() == expected; }, 1.1)
      .run();
}
BENCHMARK(getString)->Apply(rounds);

void getInt(benchmark::State &state) {
  const Both both;
  const int expected = both.options[13].number;
  Race(state, [&] { return both.map.optInt(both.key(13), -1) == expected; })
      .peer(
          "jsoncpp", [&] { return both.bare(13)->asInt() == expected; }, 1.1)
      .run();
}
BENCHMARK(getInt)->Apply(rounds);

void getList(benchmark::State &state) {
  const Both both;
  Texts own;
  Texts bare;
  Race(state, [&] { return both.map.optGet(both.key(15), own) && own == kFolders; })
      .peer(
          "jsoncpp",
          [&] {
            bare.clear();
            for (const Json::Value &element : *both.bare(15)) {
              bare.push_back(element.asString());
            }
            return bare == kFolders;
          },
          1.1)
      .run();
}
BENCHMARK(getList)->Apply(rounds);

void copyMap(benchmark::State &state) {
  const std::vector<Option> options = makeOptions(state.range(0));
  OptionMap map;
  fill(map, options);
  const Json::Value values = fillByHand(options);
  const std::string &key = options[options.size() - 2].key;
  const std::string &text = options[options.size() - 2].text;
  Race(state,
       [&] {
         const OptionMap copy(map); // NOLINT(performance-unnecessary-copy-initialization)
         return copy.optString(key, "") == text;
       })
      .peer(
          "jsoncpp",
          [&] {
            const Json::Value copy(values); // NOLINT(performance-unnecessary-copy-initialization)
            return copy[key].asString() == text;
          },
          1.1)
      .run();
}
BENCHMARK(copyMap)->Arg(20)->Arg(1000)->Apply(rounds);

} // namespace
