// SPDX-License-Identifier: Apache-2.0
// Reads the files of the workshop: JSON with comments or property lists, which may be standard input.
#pragma once

#include <optional>
#include <string>

#include "base/result.h"
#include "base/value.h"
#include "formats/places.h"

namespace veltrad::storebag {

struct Document {
  enum class Form { json, xmlList, binaryList };
  // As it was named; "-" is standard input.
  std::string file;
  std::string bytes;
  Form form = Form::json;
  Value content = false;
  // Empty for a binary list.
  formats::Places places;
};

// Why a file is no document.
struct DocumentFailure {
  std::string file;
  // Absent if it could not be read at all.
  std::optional<TextPlace> place;
  // No full stop at the end.
  std::string detail;
  std::string mend;

  // "FILE:LINE:COLUMN: text"
  std::string line() const;
};

// The bytes of a file, or of standard input if it is named "-". The error names the file.
Result<std::string, std::string> readBytes(const std::string& file);
Result<Document, DocumentFailure> readDocument(const std::string& file);
Result<Document, DocumentFailure> documentOf(std::string file, std::string bytes);

// A storebag, with its places as far as they are known.
struct StorebagDocument {
  Document document;
  // It was found in a signed container, which was not verified. There are then no places.
  bool signedContainer = false;
  // The container has signatures beside the given one.
  bool moreSignatures = false;
  Dictionary storebag;
};

// The storebag in a signed container, or a bare one.
Result<StorebagDocument, DocumentFailure> readStorebag(const std::string& file);
Result<StorebagDocument, DocumentFailure> storebagOf(const std::string& file, std::string bytes);

// The daemon's bounds for a storebag: "at most … bytes, … levels and … values".
std::string boundsOfStorebags();

}  // namespace veltrad::storebag
