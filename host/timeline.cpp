// The timeline: the current time seen in ticks, seconds and frames, the play and animation ranges,
// the time-code standard, the frame rate, playback, and the selection of frame ranges.
#include <algorithm>
#include <cmath>

#include "host/handlers.h"

namespace client3::host {

using protocol::Id;
using protocol::Reader;
using protocol::Writer;

namespace {

// The time of the start of `frame`, which must be a frame of the take.
std::uint64_t FrameTime(const Scene& scene, int frame) {
  FrameIndex(scene, frame);
  return scene.timeline.TicksOf(frame);
}

void TimelineGetTicks(Context& context, Reader&, Writer& out) { out.Put(context.scene.timeline.Now()); }

void TimelineSetTicks(Context& context, Reader& in, Writer&) {
  Timeline& t = context.scene.timeline;
  std::uint64_t ticks = in.Get<std::uint64_t>();
  std::uint64_t end = t.TicksOf(context.scene.frames + 1) - 1;
  if (ticks > end)
    throw Failure{BadFrame, std::to_string(ticks) + " ticks is past the end of the take (" + std::to_string(end) + ")"};
  t.Set(ticks);
}

void TimelineGetSecs(Context& context, Reader&, Writer& out) {
  out.Put(static_cast<float>(static_cast<double>(context.scene.timeline.Now()) / static_cast<double>(kTicksPerSecond)));
}

void TimelineSetSecs(Context& context, Reader& in, Writer&) {
  Timeline& t = context.scene.timeline;
  float seconds = in.Get<float>();
  if (!std::isfinite(seconds) || seconds < 0) Refuse("a time in seconds must be 0 or more");
  double frame = std::round(static_cast<double>(seconds) * t.rate) + 1;
  if (frame > context.scene.frames)
    throw Failure{BadFrame, std::to_string(seconds) + " seconds is past the end of the take"};
  t.Set(t.TicksOf(static_cast<int>(frame)));
}

void TimelineGetFrames(Context& context, Reader&, Writer& out) {
  const Timeline& t = context.scene.timeline;
  out.Put(std::int32_t{t.FrameAt(t.Now())});
}

void TimelineSetFrames(Context& context, Reader& in, Writer&) {
  context.scene.timeline.Set(FrameTime(context.scene, in.Get<std::int32_t>()));
}

// The ranges, in order: 1 <= anim start <= play start <= play end <= anim end <= frames.
enum Bound { PlayStart, PlayEnd, AnimStart, AnimEnd };

template <Bound B>
void GetBound(Context& context, Reader&, Writer& out) {
  const Timeline& t = context.scene.timeline;
  out.Put(std::int32_t{B == PlayStart ? t.playStart : B == PlayEnd ? t.playEnd : B == AnimStart ? t.animStart : t.animEnd});
}

template <Bound B>
void SetBound(Context& context, Reader& in, Writer&) {
  Timeline& t = context.scene.timeline;
  std::int32_t frame = in.Get<std::int32_t>();
  FrameIndex(context.scene, frame);
  Timeline next = t;
  (B == PlayStart ? next.playStart : B == PlayEnd ? next.playEnd : B == AnimStart ? next.animStart : next.animEnd) = frame;
  if (next.animStart > next.playStart || next.playStart > next.playEnd || next.playEnd > next.animEnd)
    Refuse("the ranges must keep animation start <= play start <= play end <= animation end; frame " + std::to_string(frame) +
           " would make them " + std::to_string(next.animStart) + " <= " + std::to_string(next.playStart) + " <= " +
           std::to_string(next.playEnd) + " <= " + std::to_string(next.animEnd));
  std::uint64_t now = t.Now();
  t = next;
  if (t.playing) t.Set(now);
}

void TimelineGetTimeCodeStandard(Context& context, Reader&, Writer& out) { out.Put(context.scene.timeline.standard); }

void TimelineSetTimeCodeStandard(Context& context, Reader& in, Writer&) {
  std::string_view name = in.Text();
  if (std::find(std::begin(kTimeCodeStandards), std::end(kTimeCodeStandards), name) == std::end(kTimeCodeStandards))
    Refuse("'" + std::string(name) + "' is not a time-code standard (Film, PAL, NTSC, NTSCDrop, HD50, HD60)");
  context.scene.timeline.standard = name;
}

void TimelineGetFrameRate(Context& context, Reader&, Writer& out) { out.Put(static_cast<float>(context.scene.timeline.rate)); }

void TimelineSetFrameRate(Context& context, Reader& in, Writer&) {
  Timeline& t = context.scene.timeline;
  float rate = in.Get<float>();
  if (!SupportedFrameRate(rate))
    Refuse("a frame rate must be a whole number of frames per second from 1 to 10000 that divides " +
           std::to_string(kTicksPerSecond) + " (" + NumberText(rate) + " does not)");
  std::uint64_t now = t.Now();
  t.rate = rate;
  t.Set(std::min(now, t.TicksOf(context.scene.frames)));
}

void TimelinePlay(Context& context, Reader&, Writer&) {
  Timeline& t = context.scene.timeline;
  if (t.playing) return;
  int frame = t.FrameAt(t.ticks);
  t.Set(frame < t.playStart || frame > t.playEnd ? t.TicksOf(t.playStart) : t.TicksOf(frame));
  t.playing = true;
}

void TimelineStop(Context& context, Reader&, Writer&) {
  Timeline& t = context.scene.timeline;
  t.Set(t.Now());
  t.playing = false;
}

void TimelineSelectRange(Context& context, Reader& in, Writer&) {
  Scene& scene = context.scene;
  std::int32_t first = in.Get<std::int32_t>(), last = in.Get<std::int32_t>();
  SelectMode mode = ModeOf(in.Get<std::int32_t>());
  std::size_t from = FrameIndex(scene, first), to = FrameIndex(scene, last);
  if (from > to) Refuse("a range runs from its first frame to its last: " + std::to_string(first) + " is after " + std::to_string(last));
  std::vector<bool> chosen(scene.timeline.selected.size(), false);
  std::fill(chosen.begin() + static_cast<std::ptrdiff_t>(from), chosen.begin() + static_cast<std::ptrdiff_t>(to) + 1, true);
  ApplyMode(scene.timeline.selected, chosen, mode);
}

void TimelineSelectAll(Context& context, Reader& in, Writer&) {
  auto& selected = context.scene.timeline.selected;
  ApplyMode(selected, std::vector<bool>(selected.size(), true), ModeOf(in.Get<std::int32_t>()));
}

void TimelineInvertSelection(Context& context, Reader&, Writer&) {
  auto& selected = context.scene.timeline.selected;
  ApplyMode(selected, std::vector<bool>(selected.size(), true), SelectMode::Toggle);
}

// The frames from the first to the last selected key of each channel that has selected keys.
void TimelineSelectRangeFromKeys(Context& context, Reader& in, Writer&) {
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

void TimelineGetSelectedRanges(Context& context, Reader&, Writer& out) {
  const auto& selected = context.scene.timeline.selected;
  std::vector<std::int32_t> ranges;
  for (std::size_t f = 0; f < selected.size(); ++f) {
    if (!selected[f]) continue;
    std::size_t last = f;
    while (last + 1 < selected.size() && selected[last + 1]) ++last;
    ranges.push_back(static_cast<std::int32_t>(f + 1));
    ranges.push_back(static_cast<std::int32_t>(last + 1));
    f = last;
  }
  out.Put(ranges);
}

constexpr HandlerEntry kHandlers[] = {
    {Id::TimelineGetTicks, &TimelineGetTicks, Access::Read},
    {Id::TimelineSetTicks, &TimelineSetTicks},
    {Id::TimelineGetSecs, &TimelineGetSecs, Access::Read},
    {Id::TimelineSetSecs, &TimelineSetSecs},
    {Id::TimelineGetFrames, &TimelineGetFrames, Access::Read},
    {Id::TimelineSetFrames, &TimelineSetFrames},
    {Id::TimelineGetPlayStart, &GetBound<PlayStart>, Access::Read},
    {Id::TimelineSetPlayStart, &SetBound<PlayStart>},
    {Id::TimelineGetPlayEnd, &GetBound<PlayEnd>, Access::Read},
    {Id::TimelineSetPlayEnd, &SetBound<PlayEnd>},
    {Id::TimelineGetAnimStart, &GetBound<AnimStart>, Access::Read},
    {Id::TimelineSetAnimStart, &SetBound<AnimStart>},
    {Id::TimelineGetAnimEnd, &GetBound<AnimEnd>, Access::Read},
    {Id::TimelineSetAnimEnd, &SetBound<AnimEnd>},
    {Id::TimelineGetTimeCodeStandard, &TimelineGetTimeCodeStandard, Access::Read},
    {Id::TimelineSetTimeCodeStandard, &TimelineSetTimeCodeStandard},
    {Id::TimelineGetFrameRate, &TimelineGetFrameRate, Access::Read},
    {Id::TimelineSetFrameRate, &TimelineSetFrameRate},
    {Id::TimelinePlay, &TimelinePlay},
    {Id::TimelineStop, &TimelineStop},
    {Id::TimelineSelectRange, &TimelineSelectRange},
    {Id::TimelineSelectAll, &TimelineSelectAll},
    {Id::TimelineInvertSelection, &TimelineInvertSelection},
    {Id::TimelineSelectRangeFromKeys, &TimelineSelectRangeFromKeys},
    {Id::TimelineGetSelectedRanges, &TimelineGetSelectedRanges, Access::Read},
};

}  // namespace

std::span<const HandlerEntry> TimelineHandlers() { return kHandlers; }

}  // namespace client3::host
