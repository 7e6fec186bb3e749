#include "records/TLCodable.h"

std::string TLCodable::data() const {
  TLWriter writer;
  writeTo(writer);
  return writer.take();
}

bool TLCodable::initWithData(std::string_view bytes) {
  TLReader reader(bytes);
  return readFrom(reader);
}
