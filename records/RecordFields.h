#pragma once

#include <fmt/format.h>

#include <memory>
#include <nlohmann/json.hpp>
#include <string>
#include <tuple>
#include <type_traits>
#include <typeinfo>
#include <utility>
#include <vector>

#include "records/FieldKinds.h"
#include "records/TLCodable.h"

// Field-by-field operations of the records; for the source files of records only. A record's table
// lists its fields as TLField objects, and the TLFieldKind of a field's type (records/FieldKinds.h)
// handles its value. The member functions of TLRecord at the end iterate over the table; the
// compiler unrolls the loops.

struct TLRecordAccess {
  static uint8_t has(const TLCodable& record) { return record._has; }
  static void setHas(TLCodable& record, uint8_t bit) { record._has |= bit; }
};

// One field: its number on the wire, its name in dictionaries, its member, and the presence bit of
// a scalar.
template <typename Record, typename Value>
struct TLField {
  uint32_t number;
  const char* name;
  Value Record::*member;
  uint8_t bit = 0;
};
template <typename Record, typename Value>
TLField(uint32_t, const char*, Value Record::*) -> TLField<Record, Value>;
template <typename Record, typename Value>
TLField(uint32_t, const char*, Value Record::*, uint8_t) -> TLField<Record, Value>;

namespace recordfields {

template <typename Field>
struct FieldTypes;
template <typename R, typename V>
struct FieldTypes<TLField<R, V>> {
  using Record = R;
  using Kind = TLFieldKind<V>;
};

template <typename Field>
using KindOf = typename FieldTypes<std::remove_cvref_t<Field>>::Kind;

template <typename Record, typename Field>
bool isPresent(const Record& record, const Field& field) {
  if constexpr (KindOf<Field>::isScalar) {
    return (TLRecordAccess::has(record) & field.bit) != 0;
  } else {
    return KindOf<Field>::present(record.*field.member);
  }
}

// False when the read of the whole record ends here. A scalar is marked as present before its value
// is read.
template <typename Record, typename Field>
bool readField(Record& record, const Field& field, TLReader& reader, uint64_t wireType) {
  if constexpr (KindOf<Field>::isScalar) {
    TLRecordAccess::setHas(record, field.bit);
    record.*field.member = KindOf<Field>::read(reader);
    return true;
  } else {
    return KindOf<Field>::read(record.*field.member, reader, wireType);
  }
}

// The class of a sub-record or of the elements of a list; void for other values.
template <typename Value>
struct SubRecord {
  using type = void;
};
template <typename Record>
struct SubRecord<std::shared_ptr<Record>> {
  using type = Record;
};
template <typename Record>
struct SubRecord<std::vector<std::shared_ptr<Record>>> {
  using type = Record;
};
template <typename Record>
struct SubRecord<TLRecordList<Record>> {
  using type = Record;
};

// Skips a field's value; false if it is not in the form that writeTo produces.
template <typename Record, typename Value>
bool isValueAsWritten(const TLField<Record, Value>&, TLReader& reader, uint64_t wireType) {
  using Sub = typename SubRecord<Value>::type;
  if (wireType != static_cast<uint64_t>(TLFieldKind<Value>::kWireType)) return false;
  if constexpr (std::is_void_v<Sub>) {
    return reader.takeElement() && reader.skipValue(wireType);
  } else {
    return reader.withRecord([&] { return Sub::isAsWritten(reader); });
  }
}

// Calls `body` with every field, in ascending number.
template <typename Record, typename Body>
void forEachField(Body&& body) {
  std::apply([&](const auto&... field) { (body(field), ...); }, TLRecordTable<Record>::fields);
}

// Sets the target's field to `value`, with the presence bit of a scalar.
template <typename Record, typename Field, typename Value>
void setField(Record& record, const Field& field, Value&& value) {
  record.*field.member = std::forward<Value>(value);
  TLRecordAccess::setHas(record, field.bit);
}

}  // namespace recordfields

template <typename Record>
bool TLRecord<Record>::readFrom(TLReader& reader) {
  while (reader.hasMore()) {
    const uint64_t tag = reader.readVarint();
    const uint64_t number = tag >> 3;
    const uint64_t wireType = tag & 7;
    if (reader.hasError() || wireType == static_cast<uint64_t>(TLWireType::endGroup)) break;
    bool ok = true;
    const bool known = std::apply(
        [&](const auto&... field) {
          return ((number == field.number &&
                   (ok = recordfields::readField(self(), field, reader, wireType), true)) ||
                  ...);
        },
        TLRecordTable<Record>::fields);
    if (!known) ok = reader.skipValue(wireType);
    if (!ok) return false;
  }
  return !reader.hasError();
}

template <typename Record>
bool TLRecord<Record>::isAsWritten(TLReader& reader) {
  bool ok = true;
  while (ok && reader.hasMore()) {
    const uint64_t tag = reader.readVarint();
    const bool known = std::apply(
        [&](const auto&... field) {
          return ((tag >> 3 == field.number &&
                   (ok = recordfields::isValueAsWritten(field, reader, tag & 7), true)) ||
                  ...);
        },
        TLRecordTable<Record>::fields);
    ok = ok && known;
  }
  return ok && !reader.hasError();
}

template <typename Record>
void TLRecord<Record>::writeTo(TLWriter& writer) const {
  recordfields::forEachField<Record>([&](const auto& field) {
    if (recordfields::isPresent(self(), field)) {
      recordfields::KindOf<decltype(field)>::write(field.number, self().*field.member, writer);
    }
  });
}

template <typename Record>
bool TLRecord<Record>::isEqual(const TLCodable& other) const {
  if (typeid(other) != typeid(Record)) return false;
  const auto& that = static_cast<const Record&>(other);
  return std::apply(
      [&](const auto&... field) {
        const auto equal = [&](const auto& one) {
          const bool present = recordfields::isPresent(self(), one);
          if (present != recordfields::isPresent(that, one)) return false;
          return !present ||
                 recordfields::KindOf<decltype(one)>::equal(self().*one.member, that.*one.member);
        };
        return (equal(field) && ...);
      },
      TLRecordTable<Record>::fields);
}

template <typename Record>
size_t TLRecord<Record>::hash() const {
  uint64_t result = 0;
  recordfields::forEachField<Record>([&](const auto& field) {
    if (recordfields::isPresent(self(), field)) {
      result ^= recordfields::KindOf<decltype(field)>::hash(self().*field.member);
    }
  });
  return static_cast<size_t>(result);
}

template <typename Record>
nlohmann::json TLRecord<Record>::dictionaryRepresentation() const {
  nlohmann::json dictionary = nlohmann::json::object();
  recordfields::forEachField<Record>([&](const auto& field) {
    if (recordfields::isPresent(self(), field)) {
      dictionary[field.name] =
          recordfields::KindOf<decltype(field)>::describe(self().*field.member);
    }
  });
  return dictionary;
}

template <typename Record>
std::string TLRecord<Record>::description() const {
  return fmt::format("<{}: {}> {}", TLRecordTable<Record>::name, fmt::ptr(this),
                     dictionaryRepresentation().dump());
}

template <typename Record>
void TLRecord<Record>::copyTo(Record& other) const {
  recordfields::forEachField<Record>([&](const auto& field) {
    if (recordfields::isPresent(self(), field)) {
      recordfields::setField(other, field, self().*field.member);
    }
  });
}

template <typename Record>
std::shared_ptr<Record> TLRecord<Record>::copyWithZone() const {
  auto copy = std::make_shared<Record>();
  recordfields::forEachField<Record>([&](const auto& field) {
    using Kind = recordfields::KindOf<decltype(field)>;
    if constexpr (Kind::isScalar) {
      if (recordfields::isPresent(self(), field)) {
        recordfields::setField(*copy, field, self().*field.member);
      }
    } else if (recordfields::isPresent(self(), field)) {
      (*copy).*field.member = Kind::deepCopy(self().*field.member);
    } else {
      (*copy).*field.member = {};
    }
  });
  return copy;
}

template <typename Record>
void TLRecord<Record>::mergeFrom(const Record& other) {
  recordfields::forEachField<Record>([&](const auto& field) {
    using Kind = recordfields::KindOf<decltype(field)>;
    if (!recordfields::isPresent(other, field)) return;
    if constexpr (Kind::isScalar) {
      recordfields::setField(self(), field, other.*field.member);
    } else {
      Kind::merge(other.*field.member, self().*field.member);
    }
  });
}
