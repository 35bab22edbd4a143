// The settings of the processing stages: seven records of named fields, one live value of each per
// scene. Every field has a default and a valid range (or a list of allowed words); a record is only
// ever replaced whole, after every field of the new value has been checked.
#pragma once

#include <array>
#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

#include "protocol/catalogue.h"

namespace client3::host {

// The records in the catalogue's order.
enum class Record : std::size_t {
#define CLIENT3_RECORD(X, record, what) record,
  CLIENT3_SETTINGS(CLIENT3_RECORD, )
#undef CLIENT3_RECORD
};
#define CLIENT3_RECORD(X, record, what) +1
inline constexpr std::size_t kRecordCount = 0 CLIENT3_SETTINGS(CLIENT3_RECORD, );
#undef CLIENT3_RECORD

struct Settings {
  // Each record's field values as canonical text, in the order the catalogue declares the fields.
  std::array<std::vector<std::string>, kRecordCount> values;

  Settings();  // every field at its default
  double Number(Record record, std::string_view field) const;
  bool Flag(Record record, std::string_view field) const;
  const std::string& Text(Record record, std::string_view field) const;
  // "Name=value,..." of one record, for the log and the pipeline's record of what ran.
  std::string Summary(Record record) const;
};

// The name a scene file gives a record ("OcclusionFixing", ...).
std::string_view RecordName(Record record);
// Replaces record `name` with `texts` (one text per field) when they are a valid record; otherwise
// leaves it and returns why not.
std::string SetRecordFromText(Settings& settings, std::string_view name, const std::vector<std::string>& texts);

}  // namespace client3::host
