#include "host/processing/stage.h"

#include <algorithm>
#include <chrono>
#include <thread>

#include "host/server/faults.h"
#include "host/server/log.h"

namespace client3::host {

namespace {

constexpr std::size_t kLoggedFrames = 10000;

}  // namespace

std::vector<Track> TracksOf(Scene& scene, Object& subject) {
  std::vector<Track> tracks;
  for (Object* m : scene.OfType(subject, "Marker")) {
    Channel *x = m->FindChannel("X"), *y = m->FindChannel("Y"), *z = m->FindChannel("Z");
    if (!x || !y || !z) continue;
    Track t{m, {}, {x, y, z}};
    for (Object* c : scene.OfType(subject, "Constraint"))
      if (c->Text("Active") == "true" && c->Text("Source") == m->name) t.bone = c->Text("Target"), t.constraint = c;
    tracks.push_back(t);
  }
  return tracks;
}

Progress::Progress(const Context& context, std::string what, std::size_t total)
    : what_(std::move(what)), total_(std::max<std::size_t>(total, 1)), delay_(context.faults.stageDelay()),
      logged_(static_cast<std::size_t>(context.scene.frames) >= kLoggedFrames) {}

void Progress::At(std::size_t done) {
  for (std::size_t tenth = done * 10 / total_; tenths_ < tenth;) {
    ++tenths_;
    if (logged_) LogLine("info", what_ + ": " + std::to_string(tenths_ * 10) + "% done");
    if (delay_ > 0) std::this_thread::sleep_for(std::chrono::milliseconds(delay_));
  }
}

std::string Quoted(const Object& subject) { return "subject '" + subject.name + "'"; }

void SetText(Object& object, const std::string& name, std::string value) {
  Parameter* p = object.FindParameter(name);
  if (!p) object.parameters.push_back({NewId(), name, ParameterKind::Text, "", "", "", false}), p = &object.parameters.back();
  p->value = std::move(value);
}

}  // namespace client3::host
