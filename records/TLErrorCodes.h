#pragma once

// The errors of the daemon that a client can tell apart; interfaces/errors.md describes them for
// clients in other languages. Errors of the system have kPOSIXErrorDomain and an errno.

inline constexpr const char* kTALIndexerErrorDomain = "TALIndexer";

enum class TALIndexerError {
  document = 1,          // "document has no identifier", "index failed"
  query = 3,             // the query yielded no terms
  shuttingDown = 4,      // "shutting down"
  validationFailed = 5,  // "index validation failed"
};

inline constexpr const char* kTALIndexerManagerErrorDomain = "com.quill.tallow.TALIndexerManager";

enum class TALIndexerManagerError {
  unavailable = -2,  // "Indexer unavailable."
};

// Codes are those of SQLite, and these.
inline constexpr const char* kDocStoreErrorDomain = "DocStore";

enum class TALDocStoreError {
  notFound = 12,       // no document with this identifier
  noConnection = 1001  // the store could not be opened
};
