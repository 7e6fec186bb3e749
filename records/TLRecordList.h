#pragma once

#include <memory>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/Assert.h"
#include "records/TLReader.h"

// A list of sub-records that may still be as it was on the wire: its records are made when somebody
// first asks for them. Most items that a search returns go from the document store to the client
// without a look at their attributes. A copy shares the records. One thread, also for what is
// const.
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

  // Adds a record in wire form, its length first, to a list of nothing else.
  void addWire(std::string_view delimited) {
    TL_ASSERT(_records.empty());
    _wire += delimited;
  }

  // Calls visit(bytes, delimited) for each record in wire form, without and with its length, until
  // it returns false. None once the records were asked for.
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
      return _records.back()->initWithData(bytes);  // true: isAsWritten has said so
    });
    _wire.clear();
  }

  mutable Records _records;
  mutable std::string _wire;  // records that nobody has asked for yet; then _records is empty
};
