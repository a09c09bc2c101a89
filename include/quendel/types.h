// The records and enumerations that the library and its callers share.
#ifndef QUENDEL_TYPES_H_
#define QUENDEL_TYPES_H_

#include <json/value.h>

#include <cstdint>
#include <string>

// The service's own configuration. The field starts as a JSON null; QUENDELGetConf() fills it.
struct QUENDELConf_t {
  // Key "contact" of "/usr/arvo/etc/quendel.conf": JSON text in the file, of any kind, usually an
  // array of objects. An empty array when the key is missing, empty or not JSON. Every event report
  // carries it unchanged.
  Json::Value contact;
};

// How an action that the server requested stands. Signed 32 bits; no other value occurs.
enum QuendelActionProgress_t : int {
  QUENDEL_ACT_PROGRESS_RUN = 1,      // to be carried out now
  QUENDEL_ACT_PROGRESS_DONE = 0,     // closed: done
  QUENDEL_ACT_PROGRESS_FAILED = -1,  // closed: failed
  QUENDEL_ACT_PROGRESS_NO_FILE = -3  // closed: none of the requested files could be prepared
};

// What happened on the device. Signed 32 bits; each value is the index of its name in
// QUENDEL_ACTION_NAMES.
enum QuendelEvent_t : int {
  QUENDEL_EVENT_ENABLE = 0,      // the service was switched on
  QUENDEL_EVENT_DISABLE = 1,     // the service was switched off
  QUENDEL_EVENT_POWEROFF = 2,    // the device is powering off
  QUENDEL_EVENT_REBOOT = 3,      // the device is restarting
  QUENDEL_EVENT_LOGOUT = 4,      // the cloud account was signed out
  QUENDEL_EVENT_UPDATE_INFO = 5  // the server's copy of the device's information is out of date
};

// One file of a post to the server. Copies own their texts.
struct QUENDELSendDataParam_t {
  uint64_t timestamp = 0;  // the moment that belongs to the file, seconds since the epoch
  std::string type;        // the file's kind as the server knows it; empty for collected data
  std::string path;        // absolute path of the file
  std::string fileuuid;    // the server's identifier of the file; empty for collected data
};

#endif  // QUENDEL_TYPES_H_
