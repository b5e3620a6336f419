#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string_view>
#include <utility>

#include "platform/Notifications.h"
#include "platform/PropertyListSerialization.h"

// The small services of a process whose calls go to another, which is borrowed. For wrappers that
// change or watch some of the calls.

namespace appsync {

class ForwardingPropertyLists : public PropertyListSerialization {
  public:
    using Service = PropertyListSerialization;

    explicit ForwardingPropertyLists(PropertyListSerialization& target) : target_(target) {}

    Result<PropertyList> parse(ByteView bytes) override { return target_.parse(bytes); }
    Result<Bytes> serialize(const PropertyList& value, PropertyListFormat format) override {
        return target_.serialize(value, format);
    }
    bool replaceText(Bytes& bytes, std::size_t index, std::string_view key,
                     std::string_view text) override {
        return target_.replaceText(bytes, index, key, text);
    }

  protected:
    [[nodiscard]] PropertyListSerialization& target() { return target_; }

  private:
    PropertyListSerialization& target_;
};

class ForwardingNamedNotifications : public NamedNotifications {
  public:
    using Service = NamedNotifications;

    explicit ForwardingNamedNotifications(NamedNotifications& target) : target_(target) {}

    Registration registerForState(std::string_view name) override {
        return target_.registerForState(name);
    }
    void setState(int token, std::uint64_t state) override { target_.setState(token, state); }
    void post(std::string_view name) override { target_.post(name); }

  protected:
    [[nodiscard]] NamedNotifications& target() { return target_; }

  private:
    NamedNotifications& target_;
};

class ForwardingNotificationCenter : public NotificationCenter {
  public:
    using Service = NotificationCenter;

    explicit ForwardingNotificationCenter(NotificationCenter& target) : target_(target) {}

    void addObserver(std::weak_ptr<void> observer, std::string_view name, Callback callback,
                     SuspensionBehavior behavior) override {
        target_.addObserver(std::move(observer), name, callback, behavior);
    }
    void removeObserver(const void* observer, std::string_view name) override {
        target_.removeObserver(observer, name);
    }
    void post(std::string_view name) override { target_.post(name); }

  protected:
    [[nodiscard]] NotificationCenter& target() { return target_; }

  private:
    NotificationCenter& target_;
};

}  // namespace appsync
