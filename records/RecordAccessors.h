#pragma once

#include <memory>
#include <optional>
#include <string>
#include <typeinfo>
#include <utility>
#include <vector>

#include "platform/Assert.h"
#include "platform/Text.h"

// Macros for the accessors of record fields, one per family. For record headers only: each macro
// declares a field `_name` and leaves the class in its public section.

// A number or boolean with a presence bit. The getter ignores the bit; setHas... changes only the
// bit.
#define TL_RECORD_SCALAR(type, name, Name, bit) \
  [[nodiscard]] type name() const {             \
    return _##name;                             \
  }                                             \
  TL_RECORD_PRESENCE(type, name, Name, bit, type{})

// An enumeration, kept as it came from the wire even outside the named values. The getter returns
// `fallback` while the bit is clear.
#define TL_RECORD_ENUM(type, name, Name, bit, fallback) \
  [[nodiscard]] type name() const {                     \
    return has##Name() ? _##name : (fallback);          \
  }                                                     \
  TL_RECORD_PRESENCE(type, name, Name, bit, fallback)

#define TL_RECORD_PRESENCE(type, name, Name, bit, initial)                             \
  void set##Name(type value) {                                                         \
    _##name = value;                                                                   \
    setHas##Name(true);                                                                \
  }                                                                                    \
  void setHas##Name(bool present) {                                                    \
    _has = static_cast<uint8_t>(present ? _has | k##Name##Bit : _has & ~k##Name##Bit); \
  }                                                                                    \
  [[nodiscard]] bool has##Name() const {                                               \
    return (_has & k##Name##Bit) != 0;                                                 \
  }                                                                                    \
                                                                                       \
 private:                                                                              \
  static constexpr uint8_t k##Name##Bit = (bit);                                       \
  type _##name = (initial);                                                            \
                                                                                       \
 public:

// A value that is present when it is not null: std::optional<TLString> for text,
// std::optional<std::string> for bytes, std::shared_ptr for a sub-record. An empty text is present.
#define TL_RECORD_OBJECT(type, name, Name) \
  [[nodiscard]] const type& name() const { \
    return _##name;                        \
  }                                        \
  void set##Name(type value) {             \
    _##name = std::move(value);            \
  }                                        \
  [[nodiscard]] bool has##Name() const {   \
    return static_cast<bool>(_##name);     \
  }                                        \
                                           \
 private:                                  \
  type _##name;                            \
                                           \
 public:

#define TL_RECORD_STRING(name, Name) TL_RECORD_OBJECT(std::optional<TLString>, name, Name)
#define TL_RECORD_BYTES(name, Name) TL_RECORD_OBJECT(std::optional<std::string>, name, Name)
#define TL_RECORD_RECORD(type, name, Name) TL_RECORD_OBJECT(std::shared_ptr<type>, name, Name)

// A repeated field. An absent list equals an empty one. `single` names one element; ...AtIndex
// throws std::out_of_range past the end. `type` is the class of an element, `element` the type that
// holds it.
#define TL_RECORD_REPEATED(type, element, name, Name, single, Single)           \
  [[nodiscard]] const std::vector<element>& name() const {                      \
    return _##name;                                                             \
  }                                                                             \
  void set##Name(std::vector<element> values) {                                 \
    for (const element& value : values) TL_ASSERT(recordElementIsValid(value)); \
    _##name = std::move(values);                                                \
  }                                                                             \
  void clear##Name() {                                                          \
    _##name.clear();                                                            \
  }                                                                             \
  void add##Single(element value) {                                             \
    TL_ASSERT(recordElementIsValid(value));                                     \
    _##name.push_back(std::move(value));                                        \
  }                                                                             \
  [[nodiscard]] size_t name##Count() const {                                    \
    return _##name.size();                                                      \
  }                                                                             \
  [[nodiscard]] const element& single##AtIndex(size_t index) const {            \
    return _##name.at(index);                                                   \
  }                                                                             \
  [[nodiscard]] static const std::type_info& single##Type() {                   \
    return typeid(type);                                                        \
  }                                                                             \
                                                                                \
 private:                                                                       \
  std::vector<element> _##name;                                                 \
                                                                                \
 public:

// A list of sub-records contains no null; adding one is a programming error.
#define TL_RECORD_RECORDS(type, name, Name, single, Single) \
  TL_RECORD_REPEATED(type, std::shared_ptr<type>, name, Name, single, Single)
#define TL_RECORD_STRINGS(name, Name) TL_RECORD_REPEATED(TLString, TLString, name, Name, name, Name)

inline bool recordElementIsValid(const TLString&) {
  return true;
}
template <typename Record>
bool recordElementIsValid(const std::shared_ptr<Record>& record) {
  return record != nullptr;
}
