// Android system properties on plain Linux, read from the files that hold them on a device.
#pragma once

extern "C" {

// Room for any property value and its NUL.
inline constexpr int PROPERTY_VALUE_MAX = 92;

// Copies the property `key`, or `default_value` when it is absent, to `value`, a buffer of
// PROPERTY_VALUE_MAX bytes. Returns the length of what was copied.
int property_get(const char* key, char* value, const char* default_value);

}  // extern "C"
