// The client library's records: the command-protocol parameter pair and the Output_* results and
// settings. Every Output_* record derives from Output_Result by single public inheritance; the
// virtual destructor is the only virtual operation, so a record is destroyed correctly through a
// pointer to its base. Construction, copy and destruction are the implicit members. Each record's
// fields, with their types and (for the settings) their defaults and ranges, are listed in
// OutputFields.h.
#pragma once

#include <string>
#include <vector>

#include "ZarvoSDKClientCPP/OutputFields.h"
#include "ZarvoSDKClientCPP/SafeString.h"

namespace ZarvoSDKClientCPP {

namespace ResultCode {
// Every 32-bit int is a value of the type: records and ToString take codes beyond the listed ones.
// int is also the type the enumeration has on the library's own platform, so size and layout stay.
enum Enum : int {
  Success = 0,
  UnknownStatus = 1,
  NotConnected = 1000,
  RequestTimedOut = 1001,
  ReplyParsingError = 1002,
  ApplicationError = 1003,
  InvalidFrameNumber = 1004,
  ConversionError = 1005,
  ExpectedOneFrame = 1006,
};
}  // namespace ResultCode

// A member for each row of a record's table in OutputFields.h.
#define ZARVO_DECLARE_FIELD(type, name, ...) type name;
#define ZARVO_DECLARE_RECORD(record)           \
  class record : public Output_Result {        \
  public:                                      \
    ZARVO_FIELDS_##record(ZARVO_DECLARE_FIELD) \
  };
#define ZARVO_DECLARE_LEGACY_RECORD(record) \
  class record : public Output_Result {};

class Type_Parameter {
public:
  ZARVO_FIELDS_Type_Parameter(ZARVO_DECLARE_FIELD)
};

class Output_Result {
public:
  virtual ~Output_Result() = default;
  bool Error() const { return Result != ResultCode::Success; }

  ZARVO_FIELDS_Output_Result(ZARVO_DECLARE_FIELD)
};

// Protocol records and query results.
ZARVO_PROTOCOL_RECORDS(ZARVO_DECLARE_RECORD)

class Output_GetCommandInfo : public Output_Result {
public:
  ZARVO_FIELDS_Output_GetCommandInfo(ZARVO_DECLARE_FIELD)

  std::string DefaultOutputString();
};

ZARVO_QUERY_RECORDS(ZARVO_DECLARE_RECORD)
ZARVO_LEGACY_RECORDS(ZARVO_DECLARE_LEGACY_RECORD)

// Processing settings: read with an OfflineGet...Settings operation, applied with the matching
// OfflineSet...Settings operation. New records are zero-filled; the application's defaults are the
// ones OutputFields.h gives.
ZARVO_SETTINGS_RECORDS(ZARVO_DECLARE_RECORD)

#undef ZARVO_DECLARE_RECORD
#undef ZARVO_DECLARE_LEGACY_RECORD
#undef ZARVO_DECLARE_FIELD

}  // namespace ZarvoSDKClientCPP
