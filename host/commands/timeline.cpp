// The handlers of the timeline: the current time seen in ticks, seconds and frames, the play and animation ranges,
// the time-code standard, the frame rate, playback, and the selection of frame ranges.
#include <algorithm>
#include <cmath>

#include "host/commands/command.h"
#include "host/commands/lookups.h"

namespace client3::host {

namespace {

// The time of the start of `frame`, which must be a frame of the take.
std::uint64_t FrameTime(const Scene& scene, int frame) {
  FrameIndex(scene, frame);
  return scene.timeline.TicksOf(frame);
}

// Sets one bound of the ranges, which must keep 1 <= anim start <= play start <= play end <= anim
// end <= frames.
void SetBound(Context& context, int Timeline::*bound, std::int32_t frame) {
  Timeline& t = context.scene.timeline;
  FrameIndex(context.scene, frame);
  Timeline next = t;
  next.*bound = frame;
  if (next.animStart > next.playStart || next.playStart > next.playEnd || next.playEnd > next.animEnd)
    Refuse("the ranges must keep animation start <= play start <= play end <= animation end; frame " + std::to_string(frame) +
           " would make them " + std::to_string(next.animStart) + " <= " + std::to_string(next.playStart) + " <= " +
           std::to_string(next.playEnd) + " <= " + std::to_string(next.animEnd));
  std::uint64_t now = t.Now();
  t = next;
  if (t.playing) t.Set(now);
}

}  // namespace

CLIENT3_HANDLER(TimelineGetTicks, Read) { out.Put(context.scene.timeline.Now()); }

CLIENT3_HANDLER(TimelineSetTicks, Write) {
  Timeline& t = context.scene.timeline;
  std::uint64_t ticks = in.Get<std::uint64_t>();
  std::uint64_t end = t.TicksOf(context.scene.frames + 1) - 1;
  if (ticks > end)
    throw Failure{BadFrame, std::to_string(ticks) + " ticks is past the end of the take (" + std::to_string(end) + ")"};
  t.Set(ticks);
}

CLIENT3_HANDLER(TimelineGetSecs, Read) {
  out.Put(static_cast<float>(static_cast<double>(context.scene.timeline.Now()) / static_cast<double>(kTicksPerSecond)));
}

CLIENT3_HANDLER(TimelineSetSecs, Write) {
  Timeline& t = context.scene.timeline;
  float seconds = in.Get<float>();
  if (!std::isfinite(seconds)) Refuse("a time in seconds must be a finite number, not " + NumberText(seconds));
  if (seconds < 0) throw Failure{BadFrame, std::to_string(seconds) + " seconds is before the start of the take"};
  double frame = std::round(static_cast<double>(seconds) * t.rate) + 1;
  if (frame > context.scene.frames)
    throw Failure{BadFrame, std::to_string(seconds) + " seconds is past the end of the take"};
  t.Set(t.TicksOf(static_cast<int>(frame)));
}

CLIENT3_HANDLER(TimelineGetFrames, Read) {
  const Timeline& t = context.scene.timeline;
  out.Put(std::int32_t{t.FrameAt(t.Now())});
}

CLIENT3_HANDLER(TimelineSetFrames, Write) {
  context.scene.timeline.Set(FrameTime(context.scene, in.Get<std::int32_t>()));
}

CLIENT3_HANDLER(TimelineGetPlayStart, Read) { out.Put(std::int32_t{context.scene.timeline.playStart}); }
CLIENT3_HANDLER(TimelineSetPlayStart, Write) { SetBound(context, &Timeline::playStart, in.Get<std::int32_t>()); }
CLIENT3_HANDLER(TimelineGetPlayEnd, Read) { out.Put(std::int32_t{context.scene.timeline.playEnd}); }
CLIENT3_HANDLER(TimelineSetPlayEnd, Write) { SetBound(context, &Timeline::playEnd, in.Get<std::int32_t>()); }
CLIENT3_HANDLER(TimelineGetAnimStart, Read) { out.Put(std::int32_t{context.scene.timeline.animStart}); }
CLIENT3_HANDLER(TimelineSetAnimStart, Write) { SetBound(context, &Timeline::animStart, in.Get<std::int32_t>()); }
CLIENT3_HANDLER(TimelineGetAnimEnd, Read) { out.Put(std::int32_t{context.scene.timeline.animEnd}); }
CLIENT3_HANDLER(TimelineSetAnimEnd, Write) { SetBound(context, &Timeline::animEnd, in.Get<std::int32_t>()); }

CLIENT3_HANDLER(TimelineGetTimeCodeStandard, Read) { out.Put(context.scene.timeline.standard); }

CLIENT3_HANDLER(TimelineSetTimeCodeStandard, Write) {
  std::string_view name = in.Text();
  if (std::find(std::begin(kTimeCodeStandards), std::end(kTimeCodeStandards), name) == std::end(kTimeCodeStandards))
    Refuse("'" + std::string(name) + "' is not a time-code standard (Film, PAL, NTSC, NTSCDrop, HD50, HD60)");
  context.scene.timeline.standard = name;
}

CLIENT3_HANDLER(TimelineGetFrameRate, Read) { out.Put(static_cast<float>(context.scene.timeline.rate)); }

CLIENT3_HANDLER(TimelineSetFrameRate, Write) {
  Timeline& t = context.scene.timeline;
  float rate = in.Get<float>();
  if (!SupportedFrameRate(rate))
    Refuse("a frame rate must be a whole number of frames per second from 1 to 10000 that divides " +
           std::to_string(kTicksPerSecond) + " (" + NumberText(rate) + " does not)");
  std::uint64_t now = t.Now();
  t.rate = rate;
  t.Set(std::min(now, t.TicksOf(context.scene.frames)));
}

CLIENT3_HANDLER(TimelinePlay, Write) {
  Timeline& t = context.scene.timeline;
  if (t.playing) return;
  int frame = t.FrameAt(t.ticks);
  t.Set(frame < t.playStart || frame > t.playEnd ? t.TicksOf(t.playStart) : t.TicksOf(frame));
  t.playing = true;
}

CLIENT3_HANDLER(TimelineStop, Write) {
  Timeline& t = context.scene.timeline;
  t.Set(t.Now());
  t.playing = false;
}

CLIENT3_HANDLER(TimelineSelectRange, Write) {
  Scene& scene = context.scene;
  std::int32_t first = in.Get<std::int32_t>(), last = in.Get<std::int32_t>();
  SelectMode mode = ModeOf(in.Get<std::int32_t>());
  std::size_t from = FrameIndex(scene, first), to = FrameIndex(scene, last);
  if (from > to) Refuse("a range runs from its first frame to its last: " + std::to_string(first) + " is after " + std::to_string(last));
  std::vector<bool> chosen(scene.timeline.selected.size(), false);
  std::fill(chosen.begin() + static_cast<std::ptrdiff_t>(from), chosen.begin() + static_cast<std::ptrdiff_t>(to) + 1, true);
  ApplyMode(scene.timeline.selected, chosen, mode);
}

CLIENT3_HANDLER(TimelineSelectAll, Write) {
  auto& selected = context.scene.timeline.selected;
  ApplyMode(selected, std::vector<bool>(selected.size(), true), ModeOf(in.Get<std::int32_t>()));
}

CLIENT3_HANDLER(TimelineInvertSelection, Write) {
  auto& selected = context.scene.timeline.selected;
  ApplyMode(selected, std::vector<bool>(selected.size(), true), SelectMode::Toggle);
}

// The frames from the first to the last selected key of each channel that has selected keys.
CLIENT3_HANDLER(TimelineSelectRangeFromKeys, Write) {
  Scene& scene = context.scene;
  SelectMode mode = ModeOf(in.Get<std::int32_t>());
  std::vector<bool> chosen(scene.timeline.selected.size(), false);
  for (auto& [id, o] : scene.objects)
    for (const Channel& c : o.channels) {
      auto first = std::find(c.selected.begin(), c.selected.end(), true);
      if (first == c.selected.end()) continue;
      auto last = std::find(c.selected.rbegin(), c.selected.rend(), true).base();
      std::fill(chosen.begin() + (first - c.selected.begin()), chosen.begin() + (last - c.selected.begin()), true);
    }
  ApplyMode(scene.timeline.selected, chosen, mode);
}

CLIENT3_HANDLER(TimelineGetSelectedRanges, Read) {
  const auto& selected = context.scene.timeline.selected;
  std::vector<std::int32_t> ranges;
  for (auto [first, end] : Runs(selected.size(), [&](std::size_t f) { return selected[f]; }))
    ranges.push_back(static_cast<std::int32_t>(first + 1)), ranges.push_back(static_cast<std::int32_t>(end));
  out.Put(ranges);
}

}  // namespace client3::host
