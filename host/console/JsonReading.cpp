#include "host/console/JsonReading.h"

#include <cstddef>
#include <utility>

#include <nlohmann/json.hpp>

namespace appsync {
namespace {

// Passes on what the parser finds.
class Events final : public nlohmann::json_sax<nlohmann::json> {
  public:
    explicit Events(JsonListener& listener) : listener_(listener) {}

    bool null() override { return listener_.scalar({}); }
    bool boolean(bool value) override { return listener_.scalar(value); }
    bool number_integer(number_integer_t value) override { return listener_.scalar(value); }
    bool number_unsigned(number_unsigned_t value) override { return listener_.scalar(value); }
    bool number_float(number_float_t /*value*/, const string_t& /*text*/) override {
        return listener_.scalar({});
    }
    bool string(string_t& value) override { return listener_.scalar(std::move(value)); }
    bool binary(binary_t& /*value*/) override { return false; }
    bool start_object(std::size_t /*size*/) override { return listener_.objectBegins(); }
    bool key(string_t& name) override { return listener_.memberBegins(std::move(name)); }
    bool end_object() override { return listener_.containerEnds(); }
    bool start_array(std::size_t /*size*/) override { return listener_.arrayBegins(); }
    bool end_array() override { return listener_.containerEnds(); }
    bool parse_error(std::size_t /*position*/, const std::string& /*token*/,
                     const nlohmann::detail::exception& /*error*/) override {
        return false;
    }

  private:
    JsonListener& listener_;
};

}  // namespace

bool readJson(std::string_view text, JsonListener& listener) {
    if (text.find('\0') != std::string_view::npos) return false;  // the parser takes it for the end
    Events events(listener);
    return nlohmann::json::sax_parse(text.begin(), text.end(), &events);
}

}  // namespace appsync
