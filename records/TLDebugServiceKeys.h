#pragma once

// Keys of the debug service's statistics, for the daemon and its clients: constants whose text
// equals their name. Values are whole numbers; the three ending in TimeSecs are seconds as double.

// Keys in every answer, in the order of the groups: both stores, the index, its scans, its writes.
#define TL_DEBUG_SERVICE_KEYS(X)                   \
  X(TLDebugServiceDocStoreNumOfItems)              \
  X(TLDebugServiceTextStoreNumOfItems)             \
  X(TLDebugServiceTextStoreNumOfItemsWithHtmlBody) \
  X(TLDebugServiceTextStoreNumOfItemsWithTextBody) \
  X(TLDebugServiceTextStoreSize)                   \
  X(TLDebugServiceSaltMaxDocID)                    \
  X(TLDebugServiceSaltLastDocID)                   \
  X(TLDebugServiceSaltTotalSuffixes)               \
  X(TLDebugServiceSaltNumOfPages)                  \
  X(TLDebugServiceSaltHotSuffixes)                 \
  X(TLDebugServiceSaltScanPrefixSearched)          \
  X(TLDebugServiceSaltScanTimeSecs)                \
  X(TLDebugServiceSaltScanResults)                 \
  X(TLDebugServiceSaltScanPageLoads)               \
  X(TLDebugServiceSaltScanDocTextFetches)          \
  X(TLDebugServiceSaltIndexTimeSecs)               \
  X(TLDebugServiceSaltVacuumNumOfPhases)           \
  X(TLDebugServiceSaltVacuumTimeSecs)

// Known to clients, but in no answer.
#define TL_DEBUG_SERVICE_UNUSED_KEYS(X)      \
  X(TLDebugServiceSaltTotalBytesByPages)     \
  X(TLDebugServiceSaltPageBytesInUse)        \
  X(TLDebugServiceSaltAuxIndexBytes)         \
  X(TLDebugServiceSaltHotPages)              \
  X(TLDebugServiceSaltHotPageBytes)          \
  X(TLDebugServiceSaltHotPageBytesInUse)     \
  X(TLDebugServiceSaltHotAuxIndexBytes)      \
  X(TLDebugServiceSaltHotWriteAheadLogBytes) \
  X(TLDebugServiceSaltTotalSuffixesIndexed)  \
  X(TLDebugServiceSaltIndexDocTextFetches)   \
  X(TLDebugServiceSaltMergePageLoads)        \
  X(TLDebugServiceSaltMergePageWrites)       \
  X(TLDebugServiceSaltMergeDocTextFetches)

#define TL_DEBUG_SERVICE_KEY(name) inline constexpr const char* name = #name;
TL_DEBUG_SERVICE_KEYS(TL_DEBUG_SERVICE_KEY)
TL_DEBUG_SERVICE_UNUSED_KEYS(TL_DEBUG_SERVICE_KEY)
#undef TL_DEBUG_SERVICE_KEY
