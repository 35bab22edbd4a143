// The handlers of the settings records: each is read whole and replaced whole.
#include "host/commands/command.h"
#include "host/server/log.h"
#include "host/server/text.h"

namespace client3::host {

namespace {

void GetRecord(Context& context, Record record, protocol::Writer& out) {
  auto fields = FieldsOf(record);
  const std::vector<std::string>& values = context.scene.settings.values[static_cast<std::size_t>(record)];
  for (std::size_t i = 0; i < fields.size(); ++i) FromText(values[i], fields[i].type, out);
}

// Every field is checked before the record changes.
void SetRecord(Context& context, Record record, protocol::Reader& in) {
  std::vector<std::string> texts;
  for (const protocol::Param& p : FieldsOf(record)) {
    std::string text = ToText(in, p.type);
    if (p.type == protocol::Type::String) {
      std::string plain;
      for (std::size_t i = 0; i < text.size(); ++i) plain += text[i] == '\\' && i + 1 < text.size() ? text[++i] : text[i];
      text = plain;
    }
    texts.push_back(std::move(text));
  }
  if (std::string why = context.scene.settings.Set(record, std::move(texts)); !why.empty()) Refuse(why);
  LogLine("info", "settings " + std::string(RecordName(record)) + " set: " + context.scene.settings.Summary(record));
}

}  // namespace

#define CLIENT3_SETTINGS_HANDLERS(X, record, what)                                                     \
  CLIENT3_HANDLER(OfflineGet##record##Settings, Read) { GetRecord(context, Record::record, out); } \
  CLIENT3_HANDLER(OfflineSet##record##Settings, Write) { SetRecord(context, Record::record, in); }
CLIENT3_SETTINGS(CLIENT3_SETTINGS_HANDLERS, )
#undef CLIENT3_SETTINGS_HANDLERS

}  // namespace client3::host
