// Who this device is and what runs on it.
#ifndef PLATFORM_DEVICE_H_
#define PLATFORM_DEVICE_H_

extern "C" {

// Writes the device's serial number into buf, NUL-terminated, cut to size - 1 bytes.
// Returns 0, or negative, with buf untouched, when the device has none or it cannot be read.
int ALIBGetSerialNumber(char* buf, int size);

// Tells whether a service is configured to run. Returns non-zero when it is, 0 when it is not.
int ALIBServiceIsEnabled(const char* name);
}

#endif  // PLATFORM_DEVICE_H_
