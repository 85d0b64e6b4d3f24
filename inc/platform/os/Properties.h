// System properties.
//
// A property is a `key=value` line in /etc/tavoplayer/system.prop (another file may
// be named by TAVOPLAYER_PROPERTIES). The environment variable
// TAVOPLAYER_PROP_<key with dots as underscores> overrides the file, so
// "tavoplayer.demux.source" is overridden by TAVOPLAYER_PROP_tavoplayer_demux_source.
// The file is read on every call: properties are read rarely (at open or start)
// and a change must take effect without restarting the service.
#pragma once

#include <string>

namespace TavoPlayer {

// The size of a property value buffer, terminating NUL included.
constexpr int kPropertyValueMax = 92;

// Copies the value of `key` (or `defaultValue` when it is unset; "" when that is
// null) into `value`, which holds kPropertyValueMax bytes, truncating longer values.
// Returns the length of what was copied.
int property_get(const char* key, char* value, const char* defaultValue);

// The same without the length limit, for values such as paths and URLs.
std::string propertyGetString(const std::string& key, const std::string& defaultValue);

}  // namespace TavoPlayer
