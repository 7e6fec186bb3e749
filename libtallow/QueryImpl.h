#pragma once

#include <memory>

#include "libtallow/tallow/Query.h"
#include "records/TLQuery.h"

namespace tallow {

struct Query::Impl {
  std::shared_ptr<TLQuery> record;  // not null, not shared with another query
};

}  // namespace tallow
