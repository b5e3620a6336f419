#pragma once

#include <deque>
#include <utility>

#include "platform/PropertyListSerialization.h"
#include "simulation/recording/Recorder.h"

namespace appsync {

/// Reads and writes with the codec that the test brings, records that, and fails when told to.
class SimulatedPropertyLists : public PropertyListSerialization {
  public:
    /// The codec is only borrowed.
    SimulatedPropertyLists(Recorder& recorder, PropertyListSerialization& codec)
        : recorder_(recorder), codec_(codec) {}

    Result<PropertyList> parse(ByteView bytes) override;
    Result<Bytes> serialize(const PropertyList& value, PropertyListFormat format) override;
    bool replaceText(Bytes& bytes, std::size_t index, std::string_view key,
                     std::string_view text) override;

    // The test's side; not recorded. The failures are used up one by one.
    void failNextParse(ErrorRecord error) { parseFailures_.push_back(std::move(error)); }
    void failNextSerialize(ErrorRecord error) { serializeFailures_.push_back(std::move(error)); }
    [[nodiscard]] PropertyListSerialization& codec() { return codec_; }

  private:
    Recorder& recorder_;
    PropertyListSerialization& codec_;
    std::deque<ErrorRecord> parseFailures_;
    std::deque<ErrorRecord> serializeFailures_;
};

}  // namespace appsync
