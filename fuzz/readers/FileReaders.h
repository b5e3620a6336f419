#pragma once

#include "fuzz/readers/Reading.h"

namespace appsync {

// The readers of files, each with what is promised of whatever it is given.

/// An XML property list. A refusal names line and column; what was read is written and read back
/// equal, and the reader of the plain form reads the same or nothing.
[[nodiscard]] Reading readXmlList(ByteView bytes);

/// A binary property list. A refusal names the offset; what was read is written and read back
/// equal.
[[nodiscard]] Reading readBinaryList(ByteView bytes);

/// A property list in JSON. What was read is shown as JSON and read back equal.
[[nodiscard]] Reading readJsonList(ByteView bytes);

/// A package. If it unpacks to little, it is unpacked: then what stands there is what was
/// announced, regular files and directories without dangerous modes.
[[nodiscard]] Reading readPackage(ByteView bytes);

/// An archive of an application's data, unpacked. What stands there is regular files and
/// directories without dangerous modes.
[[nodiscard]] Reading readDataArchive(ByteView bytes);

/// An icon, as the home screen shows it: what was read becomes a picture.
[[nodiscard]] Reading readIcon(ByteView bytes);

/// The manifest of a backup. All names that were read are those of a backup's files.
[[nodiscard]] Reading readManifest(ByteView bytes);

/// What the index of a library says after its sum, which is made to be right. What was read is
/// written as it was, and names legal identifiers alone.
[[nodiscard]] Reading readLibraryIndex(ByteView bytes);

/// A recording of a session. A refusal names a line, or says that it is none; of what was read each
/// line belongs to a stretch that has begun, and can be shown.
[[nodiscard]] Reading readSessionRecording(ByteView bytes);

/// Three versions, one a line: comparing them is an order.
[[nodiscard]] Reading readVersions(ByteView bytes);

}  // namespace appsync
