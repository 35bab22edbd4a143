// The handlers of the channel filters.
#include <algorithm>

#include "host/commands/command.h"
#include "host/commands/lookups.h"
#include "host/processing/filters.h"

namespace client3::host {

namespace {

// The channels a filter command names and the frames it may use: the selected ones, or all.
FilterTarget TargetOf(Scene& scene, protocol::Reader& in) {
  Object& o = ObjectOf(scene, in.Get<std::uint64_t>());
  Channel* named = &ChannelOf(o, in.Get<std::uint64_t>());
  std::string_view component = in.Text();
  bool selectedOnly = in.Get<bool>();
  FilterTarget target;
  if (component.empty()) {
    target.channels = {named};
  } else if (component == "XYZ") {
    for (std::string_view axis : {"X", "Y", "Z"}) {
      Channel* c = o.FindChannel(axis);
      if (!c) Refuse("object " + std::to_string(o.id) + " has no channel named '" + std::string(axis) + "', which component 'XYZ' needs");
      target.channels.push_back(c);
    }
    if (named != target.channels[0] && named != target.channels[1] && named != target.channels[2])
      Refuse("component 'XYZ' needs one of the channels X, Y or Z, not '" + named->name + "'");
  } else {
    Refuse("component '" + std::string(component) + "' is not '' (the channel) or 'XYZ' (the channels X, Y and Z)");
  }
  target.usable.assign(static_cast<std::size_t>(scene.frames), true);
  if (selectedOnly) {
    target.usable = scene.timeline.selected;
    if (std::find(target.usable.begin(), target.usable.end(), true) == target.usable.end())
      Refuse("only the selected frames were to be filtered, and no frame is selected");
  }
  return target;
}

}  // namespace

CLIENT3_HANDLER(FilterApplyFIR, Write) {
  FilterTarget target = TargetOf(context.scene, in);
  std::int32_t taps = in.Get<std::int32_t>();
  double cutoff = in.Get<float>(), rate = in.Get<float>(), transition = in.Get<float>();
  context.summary = Filter(target, LowPass(context.scene, taps, cutoff, rate, transition));
}

CLIENT3_HANDLER(FilterApplyWeightedAverage, Write) {
  FilterTarget target = TargetOf(context.scene, in);
  std::int32_t window = in.Get<std::int32_t>(), weighting = in.Get<std::int32_t>();
  context.summary = Filter(target, WeightedAverage(context.scene, window, weighting));
}

}  // namespace client3::host
