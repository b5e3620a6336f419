#pragma once

#include <cstddef>

namespace appsync {

/// The name of the layer between SQLite and the files of the system that a connection is opened
/// with (its VFS); null, which stands for SQLite's own, where there can be none.
///
/// SQLite writes each page that a transaction has changed by two calls, one for what leads it and
/// one for itself. This layer holds what comes for the write-ahead log until the page that ends the
/// transaction, and then writes it at once; a failure is that page's. So nobody is told of a
/// transaction before it is in the file, and what is waited for is on the disk, as ever. What is
/// held when the transaction is given up is dropped with it, before anybody else may write.
[[nodiscard]] const char* joinedLogLayer();

}  // namespace appsync
