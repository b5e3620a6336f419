#include "host/plan/Versions.h"

#include <algorithm>
#include <cstddef>

namespace appsync {
namespace {

bool isDigit(char character) { return character >= '0' && character <= '9'; }

bool isLetter(char character) {
    const char lower = static_cast<char>(character | 0x20);
    return lower >= 'a' && lower <= 'z';
}

enum class PieceKind { Word = 0, None = 1, Number = 2 };  // from low to high

struct Piece {
    PieceKind kind = PieceKind::None;
    std::string_view text;
};

template <typename Predicate>
std::string_view takeWhile(std::string_view& rest, Predicate predicate) {
    const auto end = std::find_if_not(rest.begin(), rest.end(), predicate);
    const std::string_view taken = rest.substr(0, static_cast<std::size_t>(end - rest.begin()));
    rest.remove_prefix(taken.size());
    return taken;
}

Piece nextPiece(std::string_view& rest) {
    takeWhile(rest, [](char c) { return !isDigit(c) && !isLetter(c); });
    if (rest.empty()) return {};
    if (isLetter(rest.front())) return {PieceKind::Word, takeWhile(rest, isLetter)};
    std::string_view digits = takeWhile(rest, isDigit);
    takeWhile(digits, [](char c) { return c == '0'; });  // only the value counts
    return {PieceKind::Number, digits};
}

std::weak_ordering compareText(std::string_view left, std::string_view right) {
    return left.compare(right) <=> 0;
}

// Numbers of any length, without leading zeros.
std::weak_ordering compareNumbers(std::string_view left, std::string_view right) {
    if (left.size() != right.size()) return left.size() <=> right.size();
    return compareText(left, right);
}

std::weak_ordering comparePieces(const Piece& left, const Piece& right) {
    const bool noWords = left.kind != PieceKind::Word && right.kind != PieceKind::Word;
    if (noWords) return compareNumbers(left.text, right.text);  // nothing has the value 0
    if (left.kind != right.kind) return left.kind <=> right.kind;
    return compareText(left.text, right.text);
}

}  // namespace

std::weak_ordering compareVersions(std::string_view left, std::string_view right) {
    while (!left.empty() || !right.empty()) {
        const Piece leftPiece = nextPiece(left);
        const Piece rightPiece = nextPiece(right);
        const std::weak_ordering order = comparePieces(leftPiece, rightPiece);
        if (order != 0) return order;
    }
    return std::weak_ordering::equivalent;
}

}  // namespace appsync
