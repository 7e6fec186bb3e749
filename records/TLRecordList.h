#pragma once

#include <memory>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/Assert.h"
#include "records/TLReader.h"

// A list of sub-records that may still be in wire form: its records are decoded at first use. Most
// items that a search returns pass from the document store to the client without anybody reading
// their attributes. A copy shares the records. One thread, even for const functions.
template <typename Record>
class TLRecordList {
 public:
  using Records = std::vector<std::shared_ptr<Record>>;

  TLRecordList() = default;
  TLRecordList(Records records) : _records(std::move(records)) {}
  TLRecordList(const TLRecordList& other) : _records(other.records()) {}
  TLRecordList(TLRecordList&&) = default;
  TLRecordList& operator=(TLRecordList other) noexcept {
    _records = std::move(other._records);
    _wire = std::move(other._wire);
    return *this;
  }
  ~TLRecordList() = default;

  [[nodiscard]] bool empty() const { return _wire.empty() && _records.empty(); }

  [[nodiscard]] const Records& records() const {
    if (!_wire.empty()) readWire();
    return _records;
  }
  [[nodiscard]] Records& records() {
    if (!_wire.empty()) readWire();
    return _records;
  }

  // Appends a record in wire form, length first; the list must contain nothing else.
  void addWire(std::string_view delimited) {
    TL_ASSERT(_records.empty());
    _wire += delimited;
  }

  // Calls visit(bytes, delimited) for each record in wire form, without and with its length, until
  // it returns false. Nullopt if the records are already decoded.
  template <typename Visit>
  void forEachWire(const Visit& visit) const {
    for (TLReader reader(_wire); reader.hasMore();) {
      const char* const begin = reader.position();
      const auto bytes = reader.readView();
      if (!bytes || !visit(*bytes, std::string_view(begin, reader.position()))) return;
    }
  }
  [[nodiscard]] bool isWire() const { return !_wire.empty(); }

 private:
  void readWire() const {
    forEachWire([this](std::string_view bytes, std::string_view) {
      _records.push_back(std::make_shared<Record>());
      return _records.back()->initWithData(bytes);  // succeeds, because isAsWritten has checked it
    });
    _wire.clear();
  }

  mutable Records _records;
  mutable std::string _wire;  // records not yet decoded; then _records is empty
};
