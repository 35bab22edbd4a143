// The settings of the processing stages: seven records of named fields, one live value of each per
// scene. Every field has a default and a valid range (or a list of allowed words); a record is only
// ever replaced whole, after every field of the new value has been checked.
#pragma once

#include <array>
#include <cstddef>
#include <optional>
#include <span>
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
  // Replaces the record with `texts` (one canonical text a field, in the declared order) when they
  // are a valid value of it; otherwise leaves it and returns why not.
  std::string Set(Record record, std::vector<std::string> texts);
};

// A record's name ("OcclusionFixing", ...), and the record of a name.
std::string_view RecordName(Record record);
std::optional<Record> RecordNamed(std::string_view name);
// A record's fields as the catalogue declares them (name and type), in order.
std::span<const protocol::Param> FieldsOf(Record record);

}  // namespace client3::host
