#pragma once

#include "platform/Bytes.h"
#include "platform/PropertyList.h"
#include "platform/Result.h"

namespace appsync {

/// Reads an XML property list: UTF-8, with a byte-order mark or without.
///
/// No entity other than lt, gt, amp, quot and apos is expanded, and character references; a
/// document type declaration, comments, processing instructions and attributes are skipped. White
/// space counts in strings and keys only. Two entries of a map with equal keys are refused, since
/// one of them would be lost. Memory is bounded by a small multiple of the input, whatever it
/// holds.
[[nodiscard]] Result<PropertyList> readXmlPropertyList(ByteView document);

}  // namespace appsync
