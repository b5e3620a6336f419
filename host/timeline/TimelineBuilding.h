#pragma once

#include <optional>
#include <string>
#include <unordered_map>

#include "host/timeline/Timeline.h"
#include "host/timeline/TimelineEvents.h"

namespace appsync {

/// Makes the timeline of one session of its events:
///
///     (add)* finish
class TimelineBuilding {
  public:
    /// One that is older than the event before it counts as simultaneous.
    void add(TimelineEvent event);

    /// What the events tell, until that moment at least. `goesOn`: more is to come, or is lost.
    [[nodiscard]] Timeline finish(TimelineMoment length, bool goesOn);

  private:
    void addToSession(const TimelineEvent& event);
    void addToLane(const TimelineEvent& event);
    void addToTransfer(TimelineLane& lane, const TimelineEvent& event);
    void addToInstall(TimelineLane& lane, const TimelineEvent& event);
    void beginSession(const char* kind);
    void beginPhase(const char* name, TimelineMoment at);
    void beginTransfer(TimelineLane& lane, const TimelineEvent& event);
    void endPlaceholder(TimelineLane& lane, const TimelineEvent& event);
    TimelineLane& laneOf(const TimelineEvent& event);
    void finishLane(TimelineLane& lane, bool goesOn);
    void gatherWaits();

    Timeline timeline_;
    std::unordered_map<std::string, std::size_t> lanes_;  // as indices
    TimelineMoment last_{0};
    TimelineMoment transfersFreeAt_{0};  // since when the next may be transferred
    TimelineMoment reconciled_{0};
    std::optional<TimelineWait> sessionWait_;
    bool isOver_ = false;
};

}  // namespace appsync
