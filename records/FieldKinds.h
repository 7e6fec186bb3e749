#pragma once

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <memory>
#include <nlohmann/json.hpp>
#include <optional>
#include <string>
#include <type_traits>
#include <utility>
#include <vector>

#include "platform/Assert.h"
#include "platform/Text.h"
#include "records/TLAttributeKey.h"
#include "records/TLReader.h"
#include "records/TLRecordList.h"
#include "records/TLWriter.h"

// How the value of a field is read, written, compared, hashed, copied, merged and described: one
// TLFieldKind for each C++ type that a field has. For records/RecordFields.h only.

namespace recordfields {

// Bounds the recursion depth: one guard exists for each sub-record entered.
class NestingGuard {
 public:
  NestingGuard() {
    ++_depth;
    TL_ASSERT(_depth <= kMaxRecordDepth);
  }
  ~NestingGuard() { --_depth; }
  NestingGuard(const NestingGuard&) = delete;
  NestingGuard& operator=(const NestingGuard&) = delete;

 private:
  static constinit inline thread_local int _depth = 0;
};

inline constexpr uint64_t kHashFactor = 2654435761;

// A whole number modulo 2^64.
inline uint64_t wrap(double value) {
  return static_cast<uint64_t>(std::fmod(value, 0x1p64));
}

// A number and its negation have the same hash. Infinities and NaN contribute nothing.
inline uint64_t hashOf(double value) {
  const double magnitude = std::fabs(value);
  if (!std::isfinite(magnitude)) return 0;
  const double rounded = std::floor(magnitude + 0.5);
  const double fraction = std::ldexp(magnitude - rounded, 64);
  const uint64_t whole = wrap(rounded) * kHashFactor;
  const uint64_t part = wrap(std::fabs(fraction));
  return fraction < 0 ? whole - part : whole + part;
}

// The hash of a list depends on the order.
inline uint64_t combine(uint64_t seed, uint64_t hash) {
  return seed * 31 + hash + 0x9E3779B97F4A7C15ULL;
}

inline std::string nameOf(TLAttributeKey key) {
  return TLAttributeKeyAsString(key);
}
inline std::string nameOf(TLQueryNodeOp op) {
  return TLQueryNodeOpAsString(op);
}
inline std::string nameOf(TLQueryNodeMergeOp mergeOp) {
  return TLQueryNodeMergeOpAsString(mergeOp);
}

}  // namespace recordfields

// Scalars: numbers, booleans and enumerations. Present by their bit.
template <typename Value>
struct TLFieldKind {
  static_assert(std::is_arithmetic_v<Value> || std::is_enum_v<Value>);
  static constexpr bool isScalar = true;
  static constexpr TLWireType kWireType = std::is_same_v<Value, float>    ? TLWireType::fixed32
                                          : std::is_same_v<Value, double> ? TLWireType::fixed64
                                                                          : TLWireType::varint;

  static Value read(TLReader& reader) {
    if constexpr (std::is_same_v<Value, float>) {
      return reader.readFloat();
    } else if constexpr (std::is_same_v<Value, double>) {
      return reader.readDouble();
    } else if constexpr (std::is_same_v<Value, bool>) {
      return reader.readVarint() != 0;
    } else if constexpr (std::is_enum_v<Value>) {
      return static_cast<Value>(static_cast<int32_t>(reader.readVarint()));
    } else {
      return static_cast<Value>(reader.readVarint());
    }
  }
  static void write(uint32_t number, Value value, TLWriter& writer) {
    if constexpr (std::is_same_v<Value, float>) {
      writer.writeFloatField(number, value);
    } else if constexpr (std::is_same_v<Value, double>) {
      writer.writeDoubleField(number, value);
    } else {
      // Through int64_t, so that a negative enumerator takes ten bytes.
      writer.writeVarintField(number, static_cast<uint64_t>(static_cast<int64_t>(value)));
    }
  }
  static bool equal(Value a, Value b) { return a == b; }
  static uint64_t hash(Value value) {
    if constexpr (std::is_floating_point_v<Value>) {
      return recordfields::hashOf(static_cast<double>(value));
    } else {
      return static_cast<uint64_t>(static_cast<int64_t>(value)) * recordfields::kHashFactor;
    }
  }
  static nlohmann::json describe(Value value) {
    if constexpr (std::is_enum_v<Value>) {
      return recordfields::nameOf(value);
    } else {
      return value;
    }
  }
};

// Text.
template <>
struct TLFieldKind<std::optional<TLString>> {
  using Value = std::optional<TLString>;
  static constexpr bool isScalar = false;
  static constexpr TLWireType kWireType = TLWireType::lengthDelimited;

  static bool present(const Value& value) { return value.has_value(); }
  static bool read(Value& value, TLReader& reader, uint64_t) {
    value = reader.readString();
    return true;
  }
  static void write(uint32_t number, const Value& value, TLWriter& writer) {
    writer.writeStringField(number, *value);
  }
  static bool equal(const Value& a, const Value& b) { return a == b; }
  static uint64_t hash(const Value& value) { return std::hash<TLString>()(*value); }
  static Value deepCopy(const Value& value) { return value; }
  static void merge(const Value& from, Value& to) { to = from; }
  static nlohmann::json describe(const Value& value) { return platform::toUTF8(*value); }
};

// Bytes.
template <>
struct TLFieldKind<std::optional<std::string>> {
  using Value = std::optional<std::string>;
  static constexpr bool isScalar = false;
  static constexpr TLWireType kWireType = TLWireType::lengthDelimited;

  static bool present(const Value& value) { return value.has_value(); }
  static bool read(Value& value, TLReader& reader, uint64_t) {
    value = reader.readBytes();
    return true;
  }
  static void write(uint32_t number, const Value& value, TLWriter& writer) {
    writer.writeBytesField(number, *value);
  }
  static bool equal(const Value& a, const Value& b) { return a == b; }
  static uint64_t hash(const Value& value) { return std::hash<std::string>()(*value); }
  static Value deepCopy(const Value& value) { return value; }
  static void merge(const Value& from, Value& to) { to = from; }
  static nlohmann::json describe(const Value& value) {
    return nlohmann::json::binary(std::vector<uint8_t>(value->begin(), value->end()));
  }
};

// A sub-record. It is stored before it is read, so a failed read leaves it partly read.
template <typename Record>
struct TLFieldKind<std::shared_ptr<Record>> {
  using Value = std::shared_ptr<Record>;
  static constexpr bool isScalar = false;
  static constexpr TLWireType kWireType = TLWireType::lengthDelimited;

  static bool present(const Value& value) { return value != nullptr; }
  static bool read(Value& value, TLReader& reader, uint64_t) {
    value = std::make_shared<Record>();
    return reader.readRecord(*value);
  }
  static void write(uint32_t number, const Value& value, TLWriter& writer) {
    const recordfields::NestingGuard guard;
    writer.writeRecordField(number, *value);
  }
  static bool equal(const Value& a, const Value& b) {
    const recordfields::NestingGuard guard;
    // Compares even a record with itself: one that contains NaN equals nothing.
    return a != nullptr && b != nullptr ? a->isEqual(*b) : a == b;
  }
  static uint64_t hash(const Value& value) {
    const recordfields::NestingGuard guard;
    return value->hash();
  }
  static Value deepCopy(const Value& value) {
    const recordfields::NestingGuard guard;
    return value->copyWithZone();
  }
  static void merge(const Value& from, Value& to) {
    if (to == nullptr) {
      to = from;
    } else if (to != from) {
      to->mergeFrom(*from);
    }
  }
  static nlohmann::json describe(const Value& value) {
    const recordfields::NestingGuard guard;
    return value->dictionaryRepresentation();
  }
};

// Common code of lists. `Elements` defines how an element is handled.
template <typename Element, typename Elements>
struct TLListKind {
  using Value = std::vector<Element>;
  static constexpr bool isScalar = false;
  static constexpr TLWireType kWireType =
      std::is_same_v<Element, int32_t> ? TLWireType::varint : TLWireType::lengthDelimited;

  static bool present(const Value& value) { return !value.empty(); }
  static bool equal(const Value& a, const Value& b) {
    return std::equal(a.begin(), a.end(), b.begin(), b.end(), Elements::equalElements);
  }
  static uint64_t hash(const Value& value) {
    uint64_t result = value.size();
    for (const Element& element : value) {
      result = recordfields::combine(result, Elements::hashElement(element));
    }
    return result;
  }
  static Value deepCopy(const Value& value) {
    Value copy;
    copy.reserve(value.size());
    for (const Element& element : value) copy.push_back(Elements::copyElement(element));
    return copy;
  }
  // `from` and `to` may be the same list.
  static void merge(const Value& from, Value& to) {
    const size_t count = from.size();
    to.reserve(to.size() + count);
    for (size_t i = 0; i < count; ++i) to.push_back(from[i]);
  }
  static void write(uint32_t number, const Value& value, TLWriter& writer) {
    for (const Element& element : value) Elements::writeElement(number, element, writer);
  }
  static nlohmann::json describe(const Value& value) {
    nlohmann::json list = nlohmann::json::array();
    for (const Element& element : value) list.push_back(Elements::describeElement(element));
    return list;
  }
};

// Repeated text, one wire field per element.
template <>
struct TLFieldKind<std::vector<TLString>>
    : TLListKind<TLString, TLFieldKind<std::vector<TLString>>> {
  static bool read(Value& value, TLReader& reader, uint64_t) {
    if (!reader.takeElement()) return false;
    if (auto text = reader.readString()) value.push_back(std::move(*text));
    return true;
  }
  static void writeElement(uint32_t number, const TLString& element, TLWriter& writer) {
    writer.writeStringField(number, element);
  }
  static bool equalElements(const TLString& a, const TLString& b) { return a == b; }
  static uint64_t hashElement(const TLString& element) { return std::hash<TLString>()(element); }
  static TLString copyElement(const TLString& element) { return element; }
  static nlohmann::json describeElement(const TLString& element) {
    return platform::toUTF8(element);
  }
};

// Numbers of an enumeration, written as one wire field per element; packed ones can be read too.
template <>
struct TLFieldKind<std::vector<int32_t>> : TLListKind<int32_t, TLFieldKind<std::vector<int32_t>>> {
  static bool read(Value& value, TLReader& reader, uint64_t wireType) {
    const auto readOne = [&] { value.push_back(static_cast<int32_t>(reader.readVarint())); };
    if (wireType != static_cast<uint64_t>(TLWireType::lengthDelimited)) {
      readOne();
      return true;
    }
    return reader.withLengthLimit([&] {
      while (reader.hasMore()) readOne();
      return !reader.hasError();
    });
  }
  static void writeElement(uint32_t number, int32_t element, TLWriter& writer) {
    writer.writeVarintField(number, static_cast<uint64_t>(int64_t{element}));
  }
  static bool equalElements(int32_t a, int32_t b) { return a == b; }
  static uint64_t hashElement(int32_t element) { return static_cast<uint64_t>(element); }
  static int32_t copyElement(int32_t element) { return element; }
  static nlohmann::json describeElement(int32_t element) {
    return TLAttributeKeyAsString(static_cast<TLAttributeKey>(element));
  }
};

// Repeated sub-records, one wire field per element.
template <typename Record>
struct TLFieldKind<std::vector<std::shared_ptr<Record>>>
    : TLListKind<std::shared_ptr<Record>, TLFieldKind<std::vector<std::shared_ptr<Record>>>> {
  using Element = std::shared_ptr<Record>;
  using One = TLFieldKind<Element>;

  static bool read(std::vector<Element>& value, TLReader& reader, uint64_t wireType) {
    // Items have a handful of attributes: skips the first growth steps.
    if (value.capacity() == 0) value.reserve(4);
    return One::read(value.emplace_back(), reader, wireType);
  }
  static void writeElement(uint32_t number, const Element& element, TLWriter& writer) {
    One::write(number, element, writer);
  }
  static bool equalElements(const Element& a, const Element& b) { return One::equal(a, b); }
  static uint64_t hashElement(const Element& element) { return One::hash(element); }
  static Element copyElement(const Element& element) { return One::deepCopy(element); }
  static nlohmann::json describeElement(const Element& element) { return One::describe(element); }
};

// Repeated sub-records that may still be in wire form.
template <typename Record>
struct TLFieldKind<TLRecordList<Record>> {
  using Value = TLRecordList<Record>;
  using Kind = TLFieldKind<typename Value::Records>;
  static constexpr bool isScalar = false;
  static constexpr TLWireType kWireType = TLWireType::lengthDelimited;

  static bool present(const Value& value) { return !value.empty(); }
  static bool read(Value& value, TLReader& reader, uint64_t wireType) {
    if (!reader.keepsWire()) return Kind::read(value.records(), reader, wireType);
    if (wireType != static_cast<uint64_t>(TLWireType::lengthDelimited)) return false;
    const char* const begin = reader.position();
    if (!reader.withRecord([&] { return Record::isAsWritten(reader); })) return false;
    value.addWire({begin, reader.position()});
    return true;
  }
  static void write(uint32_t number, const Value& value, TLWriter& writer) {
    if (!value.isWire()) return Kind::write(number, value.records(), writer);
    value.forEachWire([&](std::string_view, std::string_view delimited) {
      writer.writeDelimitedField(number, delimited);
      return true;
    });
  }
  static bool equal(const Value& a, const Value& b) {
    return Kind::equal(a.records(), b.records());
  }
  static uint64_t hash(const Value& value) { return Kind::hash(value.records()); }
  static Value deepCopy(const Value& value) { return Kind::deepCopy(value.records()); }
  static void merge(const Value& from, Value& to) { Kind::merge(from.records(), to.records()); }
  static nlohmann::json describe(const Value& value) { return Kind::describe(value.records()); }
};
