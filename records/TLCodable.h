#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <nlohmann/json_fwd.hpp>
#include <string>
#include <string_view>

#include "records/TLReader.h"
#include "records/TLWriter.h"

// Common base of the records that travel over the RPC and lie in the document store, in Protocol
// Buffers wire format. A record is a plain value without a lock: one thread owns it at a time.
// Records are not copied by assignment; see copyTo and copyWithZone of TLRecord.
class TLCodable {
 public:
  virtual ~TLCodable() = default;
  TLCodable(const TLCodable&) = delete;
  TLCodable& operator=(const TLCodable&) = delete;

  // The record in wire form, fields in ascending number. A record with nothing set has no bytes.
  [[nodiscard]] std::string data() const;

  // Reads `bytes` into this record. False after bad input; the record then holds what was read up
  // to the fault. Unknown fields are dropped.
  [[nodiscard]] bool initWithData(std::string_view bytes);

  [[nodiscard]] virtual bool readFrom(TLReader& reader) = 0;
  virtual void writeTo(TLWriter& writer) const = 0;

  // Same class, same presence, same values; floating point by ==. Equal records hash alike.
  [[nodiscard]] virtual bool isEqual(const TLCodable& other) const = 0;
  [[nodiscard]] virtual size_t hash() const = 0;

  // One entry per present field, for logs and diagnostics. Holds personal text in clear.
  [[nodiscard]] virtual nlohmann::json dictionaryRepresentation() const = 0;
  // Class, address and that dictionary.
  [[nodiscard]] virtual std::string description() const = 0;

 protected:
  TLCodable() = default;

  // Presence bits of the scalars.
  uint8_t _has = 0;

 private:
  friend struct TLRecordAccess;
};

// The operations that every record class derives from the table of its fields, which stands in the
// class's source file as a specialisation of TLRecordTable.
template <typename Record>
class TLRecord : public TLCodable {
 public:
  [[nodiscard]] bool readFrom(TLReader& reader) override;
  // Steps over a record up to the reader's limit. True when it is nothing but fields of this class
  // in the form that writeTo gives them, in any order: then readFrom can read it.
  [[nodiscard]] static bool isAsWritten(TLReader& reader);
  void writeTo(TLWriter& writer) const override;
  [[nodiscard]] bool isEqual(const TLCodable& other) const override;
  [[nodiscard]] size_t hash() const override;
  [[nodiscard]] nlohmann::json dictionaryRepresentation() const override;
  [[nodiscard]] std::string description() const override;

  // Writes what is set here into `other`: strings and bytes are copied, sub-records and list
  // elements shared; a list that is not empty replaces the target's.
  void copyTo(Record& other) const;

  // A new record that shares nothing with this one.
  [[nodiscard]] std::shared_ptr<Record> copyWithZone() const;

  // What `other` has set overwrites this record. A sub-record is merged into the one that is here,
  // or taken over by reference where there is none; lists are appended to, elements shared.
  void mergeFrom(const Record& other);

 private:
  [[nodiscard]] const Record& self() const { return static_cast<const Record&>(*this); }
  [[nodiscard]] Record& self() { return static_cast<Record&>(*this); }
};

// Per record class: its name, and the tuple `fields` of the fields by ascending number.
template <typename Record>
struct TLRecordTable;
