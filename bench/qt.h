// Qt's part in the benchmarks. It has a source file of its own, since Qt wants to be compiled as
// position-independent code. A work is empty without Qt.
#ifndef KORU_BENCH_QT_H
#define KORU_BENCH_QT_H

#include <string>
#include <vector>

#include "work.h"

namespace bench {

Work qtDecode(std::string const& text);
Work qtEncode(std::wstring const& text);

/// Compares without regard to case.
Work qtCompare(std::wstring const& a, std::wstring const& b);

/// Identifiers from their text forms, in turn: as the strings of Qt, and as views of bytes.
Work qtParse(std::vector<std::string> const& texts);
Work qtParseLatin1(std::vector<std::string> const& texts);

/// The text forms of identifiers that have these, in turn.
Work qtFormat(std::vector<std::string> const& texts);

} // namespace bench

#endif
