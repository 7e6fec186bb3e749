#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <nlohmann/json_fwd.hpp>
#include <string>
#include <string_view>

#include "records/TLReader.h"
#include "records/TLWriter.h"

// Common base of the records that are sent over RPC and kept in the document store, in Protocol
// Buffers wire format. A record is a plain value without a lock: one thread owns it at a time.
// Records are not copied by assignment; see copyTo and copyWithZone of TLRecord.
class TLCodable {
 public:
  virtual ~TLCodable() = default;
  TLCodable(const TLCodable&) = delete;
  TLCodable& operator=(const TLCodable&) = delete;

  // The record in wire form, fields in ascending number. An empty record has no bytes.
  [[nodiscard]] std::string data() const;

  // Reads `bytes` into this record. False for invalid input; the record then holds what was read
  // before the fault. Unknown fields are dropped.
  [[nodiscard]] bool initWithData(std::string_view bytes);

  [[nodiscard]] virtual bool readFrom(TLReader& reader) = 0;
  virtual void writeTo(TLWriter& writer) const = 0;

  // Same class, same presence, same values; floating point is compared with ==. Equal records have
  // equal hashes.
  [[nodiscard]] virtual bool isEqual(const TLCodable& other) const = 0;
  [[nodiscard]] virtual size_t hash() const = 0;

  // One entry per present field, for logs and diagnostics. Contains personal text in clear.
  [[nodiscard]] virtual nlohmann::json dictionaryRepresentation() const = 0;
  // Class, address and the dictionary.
  [[nodiscard]] virtual std::string description() const = 0;

 protected:
  TLCodable() = default;

  // Presence bits of the scalars.
  uint8_t _has = 0;

 private:
  friend struct TLRecordAccess;
};

// Implements the operations of a record class from the table of its fields, a specialisation of
// TLRecordTable in the class's source file.
template <typename Record>
class TLRecord : public TLCodable {
 public:
  [[nodiscard]] bool readFrom(TLReader& reader) override;
  // Skips a record up to the reader's limit. True if it consists only of fields of this class in
  // the form that writeTo produces, in any order: then readFrom can read it.
  [[nodiscard]] static bool isAsWritten(TLReader& reader);
  void writeTo(TLWriter& writer) const override;
  [[nodiscard]] bool isEqual(const TLCodable& other) const override;
  [[nodiscard]] size_t hash() const override;
  [[nodiscard]] nlohmann::json dictionaryRepresentation() const override;
  [[nodiscard]] std::string description() const override;

  // Copies the present fields into `other`: strings and bytes are copied, sub-records and list
  // elements shared; a non-empty list replaces the target's.
  void copyTo(Record& other) const;

  // A deep copy.
  [[nodiscard]] std::shared_ptr<Record> copyWithZone() const;

  // Present fields of `other` overwrite those of this record. A sub-record is merged into an
  // existing one, or else shared; lists are appended to, sharing the elements.
  void mergeFrom(const Record& other);

 private:
  [[nodiscard]] const Record& self() const { return static_cast<const Record&>(*this); }
  [[nodiscard]] Record& self() { return static_cast<Record&>(*this); }
};

// Per record class: its name, and the tuple `fields` of its fields in ascending number.
template <typename Record>
struct TLRecordTable;
