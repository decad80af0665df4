// The option map itself: typed values in memory, copying, and the binding to a section.

#include "kovabackup/option_map.h"

#include "kovaplatform/kovacore.h"
#include "option/option_map_private.h"
#include "option/secret.h"

#include <cstdio>
#include <utility>

namespace KOVA::Backup {
namespace {

Json::Value listOf(const std::list<std::string> &texts) {
  return Base::JsonMemory::withBadAlloc([&] {
    Json::Value list(Json::arrayValue);
    for (const std::string &text : texts) {
      list.append(text);
    }
    return list;
  });
}

std::unique_ptr<OptionMapPrivate> copyOf(const OptionMapPrivate &original) {
  return Base::JsonMemory::withBadAlloc(
      [&] { return std::make_unique<OptionMapPrivate>(original); });
}

} // namespace

std::string sectionName(const std::string &prefix, int id) {
  return id < 0 ? prefix : prefix + std::to_string(id);
}

bool platformCanCarry(const std::string &name, int code, int place) {
  if (name.find('\0') == std::string::npos) {
    return true;
  }
  KLIBCErrSetEx(code, kOptionModule, place);
  return false;
}

void OptionMapPrivate::bind(const std::string &path, const std::string &prefix, int id) {
  SectionInfo bound = section; // a copy: on bad_alloc the old binding is unchanged
  bound.path = path;
  bound.name = sectionName(prefix, id);
  bound.id = id;
  section = std::move(bound);
}

const Json::Value *OptionMapPrivate::find(const std::string &key) const {
  return values.isObject() ? values.find(key.data(), key.data() + key.size()) : nullptr;
}

Json::Value &OptionMapPrivate::member(const std::string &key) {
  if (!values.isObject()) {
    values = Json::Value(Json::objectValue);
  }
  return values[key];
}

void OptionMapPrivate::clearValues() {
  if (values.isObject() || values.isArray()) {
    values.clear();
  } else {
    values = Json::Value();
  }
}

OptionMap::OptionMap() : d(new OptionMapPrivate) {}

OptionMap::OptionMap(const OptionMap &other) : d(copyOf(*other.d)) {}

OptionMap &
OptionMap::operator=(const OptionMap &other) { // NOLINT(cert-oop54-cpp): optCloneTo copes with it
  (void)other.optCloneTo(*this);
  return *this;
}

OptionMap::~OptionMap() = default;

bool OptionMap::optCloneTo(OptionMap &target) const {
  target.d = copyOf(*d); // on bad_alloc target is unchanged
  return true;
}

std::string OptionMap::optString(const std::string &key, const std::string &def) const {
  const Json::Value *value = d->find(key);
  return value != nullptr ? value->asString() : def;
}

std::string OptionMap::optSecret(const std::string &key, const std::string &def) const {
  const Json::Value *value = d->find(key);
  return value != nullptr ? secretDecrypt(value->asString()) : def;
}

int OptionMap::optInt(const std::string &key, int def) const {
  const Json::Value *value = d->find(key);
  return value != nullptr ? value->asInt() : def;
}

bool OptionMap::optBool(const std::string &key, bool def) const {
  const Json::Value *value = d->find(key);
  return value != nullptr ? value->asBool() : def;
}

bool OptionMap::optGet(const std::string &key, std::string &out, bool secret) const {
  const Json::Value *value = d->find(key);
  if (value == nullptr) {
    return false;
  }
  if (secret) {
    const ClearText clear{secretDecrypt(value->asString())};
    out = clear.text; // a copy: moving a short text would leave it on the stack
  } else {
    out = value->asString();
  }
  return true;
}

bool OptionMap::optGet(const std::string &key, char *buf, unsigned int size, bool secret) const {
  const Json::Value *value = d->find(key);
  if (value == nullptr) {
    return false;
  }
  if (secret) {
    const ClearText clear{secretDecrypt(value->asString())};
    (void)std::snprintf(buf, size, "%s", clear.text.c_str()); // deliberately cut to the buffer
  } else {
    (void)std::snprintf(buf, size, "%s", value->asCString());
  }
  return true;
}

bool OptionMap::optGet(const std::string &key, int &out) const {
  const Json::Value *value = d->find(key);
  if (value == nullptr) {
    return false;
  }
  out = value->asInt();
  return true;
}

bool OptionMap::optGet(const std::string &key, long long &out) const {
  const Json::Value *value = d->find(key);
  if (value == nullptr) {
    return false;
  }
  out = value->asInt64();
  return true;
}

bool OptionMap::optGet(const std::string &key, bool &out) const {
  const Json::Value *value = d->find(key);
  if (value == nullptr) {
    return false;
  }
  out = value->asBool();
  return true;
}

bool OptionMap::optGet(const std::string &key, std::list<std::string> &out) const {
  const Json::Value *value = d->find(key);
  if (value == nullptr) {
    return false;
  }
  std::list<std::string> elements; // out is unchanged when an element cannot be text
  for (const Json::Value &element : *value) {
    elements.push_back(element.asString());
  }
  out.swap(elements);
  return true;
}

bool OptionMap::optSet(const std::string &key, const std::string &value, bool secret) {
  if (secret) {
    d->store(key, secretEncrypt(value));
  } else {
    d->store(key, value);
  }
  return true;
}

bool OptionMap::optSet(const std::string &key, const char *value, bool secret) {
  if (!secret) {
    d->store(key, value);
    return true;
  }
  const ClearText clear{value};
  return optSet(key, clear.text, true);
}

bool OptionMap::optSet(const std::string &key, int value) {
  d->store(key, value);
  return true;
}

bool OptionMap::optSet(const std::string &key, long long value) {
  d->store(key, static_cast<Json::Int64>(value));
  return true;
}

bool OptionMap::optSet(const std::string &key, bool value) {
  d->store(key, value);
  return true;
}

bool OptionMap::optSet(const std::string &key, const std::list<std::string> &value) {
  d->store(key, listOf(value));
  return true;
}

bool OptionMap::optRemove(const std::string &key) {
  Json::Value removed;
  return d->find(key) != nullptr && d->values.removeMember(key, &removed) && !removed.isNull();
}

bool OptionMap::optClear() {
  d->clearValues();
  d->section = SectionInfo();
  return true;
}

bool OptionMap::optIsLoaded() const {
  return d->section.loaded;
}

int OptionMap::optSectionGetId() const {
  return d->isBound() ? d->section.id : -1;
}

std::string OptionMap::optSectionGetName() const {
  return d->isBound() ? d->section.name : std::string();
}

} // namespace KOVA::Backup
