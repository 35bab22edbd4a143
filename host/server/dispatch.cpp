#include "host/server/dispatch.h"

namespace client3::host {

using protocol::Id;

namespace {

struct Entry {
  void (*run)(Context&, protocol::Reader&, protocol::Writer&);
  const Access* access;
};

constexpr Entry kEntries[] = {
#define CLIENT3_ENTRY(name, ...) {&Handler<Id::name>::Run, &Handler<Id::name>::access},
    CLIENT3_COMMANDS(CLIENT3_ENTRY)
#undef CLIENT3_ENTRY
};

const Entry& EntryOf(Id id) { return kEntries[static_cast<std::size_t>(id)]; }

}  // namespace

Access AccessOf(Id id) { return *EntryOf(id).access; }

void Run(Id id, Context& context, protocol::Reader& in, protocol::Writer& out) { EntryOf(id).run(context, in, out); }

}  // namespace client3::host
