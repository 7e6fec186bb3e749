#pragma once

#include <memory>

#include "libtallow/tallow/Item.h"
#include "records/TLIndexableItem.h"

namespace tallow {

struct Item::Impl {
  std::shared_ptr<TLIndexableItem> record;  // not null, not shared with another item
};

}  // namespace tallow
