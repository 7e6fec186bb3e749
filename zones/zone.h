#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "platform/Text.h"
#include "tokenizer/Tokenizer.h"

// The texts of one document before they are added to the text index. One thread.
namespace zone {

// The text of one zone: UTF-8, values separated by one NUL.
class Zone {
 public:
  // Adds the cleaned words of the text.
  void AddText(TLStringView value, const tokenizer::Tokenizer& tokenizer);

  // Adds text that is cleaned already: a match may begin at its start and after each space.
  void AddTokenizedText(std::string_view value);

  // Adds a value that matches only as a whole or by its beginning.
  void AddTextAsIs(std::string_view value);

  std::string text;
  // Byte positions in `text` at which a match may begin, ascending.
  std::vector<uint32_t> offsets;

 private:
  // Separates the next value from the previous one, and returns its position.
  size_t beginValue();
};

// The zones of one document by ZoneID, in no particular order.
class Zones {
 public:
  // Creates an empty zone if it is absent. References stay valid when others are added.
  [[nodiscard]] Zone& GetZone(uint16_t zoneID) { return _zones[zoneID]; }

  [[nodiscard]] size_t size() const { return _zones.size(); }
  [[nodiscard]] auto begin() const { return _zones.begin(); }
  [[nodiscard]] auto end() const { return _zones.end(); }
  [[nodiscard]] auto begin() { return _zones.begin(); }
  [[nodiscard]] auto end() { return _zones.end(); }

 private:
  std::unordered_map<uint16_t, Zone> _zones;
};

}  // namespace zone
