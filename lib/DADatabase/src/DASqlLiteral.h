#ifndef DASQLLITERAL_H
#define DASQLLITERAL_H

// How values are written into SQL texts, in one place for the generator and
// the typed values.

#include <cstddef>
#include <string>

// Appends value as an SQL text literal, doubling any single quote in it.
void DAAppendTextLiteral(std::string& sql, const std::string& value);

// Appends size bytes as a blob literal: X'0A1B' (upper-case hex, X'' when
// empty).
void DAAppendBlobLiteral(std::string& sql, const unsigned char* bytes, std::size_t size);

// The shortest text of value that reads back as the same double, in the
// classic locale whatever the global one.
std::string DANumberText(double value);

#endif  // DASQLLITERAL_H
