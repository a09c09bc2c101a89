// The device's time zone.
#ifndef PLATFORM_ZONE_H_
#define PLATFORM_ZONE_H_

extern "C" {

// Writes the name of the configured time zone, "Europe/Berlin", into `zone`, NUL-terminated and cut
// to size - 1 bytes. `index` gets the zone's place in the time zone data's table of places, counted
// from 0, or -1 for a zone that the table does not list; null is allowed. Returns 0, or negative
// when no time zone is configured.
int ARVOZoneGet(char* zone, int size, int* index);

// Writes the description of a time zone for a reader, "(GMT+01:00) Europe/Berlin", into `desc`,
// NUL-terminated and cut to size - 1 bytes. The offset is that of the zone's winter time.
// Returns 0, or negative, with `desc` untouched, for a name that is no time zone.
int ARVOZoneDesc(const char* zone, char* desc, int size);
}

#endif  // PLATFORM_ZONE_H_
