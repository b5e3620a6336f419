#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "platform/Bytes.h"
#include "platform/PropertyList.h"

namespace appsync {

// How single values are spelled in XML. The readers of values ignore white space around them.

[[nodiscard]] constexpr bool isXmlSpace(char c) {
    return c == ' ' || c == '\t' || c == '\n' || c == '\r';
}

/// Whether a text means just itself: no references, and no line ends other than newlines.
[[nodiscard]] bool isXmlTextLiteral(std::string_view text) noexcept;

/// Appends what a text means: line ends made newlines and, if asked, references expanded. Gives the
/// place in it of a reference that cannot be expanded, if there is one.
[[nodiscard]] std::optional<std::size_t> appendXmlText(std::string_view text, bool references,
                                                       std::string& meaning);

/// A value, or where in the text it stops making sense.
template <typename Value>
struct XmlValue {
    std::optional<Value> value;
    std::size_t badAt = 0;  // only when there is no value
};

/// A decimal number with an optional sign, or 0x and hexadecimal digits; 64 bits, signed or not.
[[nodiscard]] XmlValue<PropertyList> integerFromXml(std::string_view text);

/// A decimal number, or "inf", "infinity", "nan" in any case, with an optional sign.
[[nodiscard]] XmlValue<double> realFromXml(std::string_view text);

/// The shortest text that reads as the same number: "0.1", "inf", "-inf", "nan".
[[nodiscard]] std::string realToXml(double value);

/// "YYYY-MM-DDTHH:MM:SSZ" in the Gregorian calendar, years 0001 to 9999. A fraction of a second is
/// refused: no writer of the format has one, and it could not be written back.
[[nodiscard]] XmlValue<PropertyList::Date> dateFromXml(std::string_view text);

/// The date, rounded down to the second, as the format has no fractions; nothing when the year is
/// not in 0001 to 9999.
[[nodiscard]] std::optional<std::string> dateToXml(PropertyList::Date date);

/// Base64 with padding, white space anywhere.
[[nodiscard]] XmlValue<Bytes> dataFromXml(std::string_view text);

/// Base64 in lines of 76 characters; each line is begun with `indentation` and ended with a
/// newline.
void appendDataAsXml(ByteView data, std::string_view indentation, std::string& text);

}  // namespace appsync
