// The one home of every fixed path on the appliance that the library, its platform and the programs
// around it share. The name of a run's own directory is made where the run gets it.
#ifndef BASE_PATHS_H_
#define BASE_PATHS_H_

namespace quendel {

// Settings, and where they lie. Only the stand-alone platform reads device.conf.
inline constexpr char kSettingsDir[] = "/usr/arvo/etc";
inline constexpr char kDeviceConfFile[] = "/usr/arvo/etc/device.conf";
inline constexpr char kServiceConfFile[] = "/usr/arvo/etc/quendel.conf";
inline constexpr char kDefaultsFile[] = "/etc.defaults/arvoinfo.conf";
inline constexpr char kVersionFile[] = "/etc.defaults/VERSION";

// One file per collector, and its state.
inline constexpr char kCollectorConfDir[] = "/usr/arvo/etc/quendel";

// Where requested files are prepared, and where the collectors' state is staged.
inline constexpr char kWorkRoot[] = "/tmp/quendel";
inline constexpr char kLogUpdateFile[] = "/tmp/quendel/quendel.log.update.conf";
inline constexpr char kUdcUpdateFile[] = "/tmp/quendel/quendel.udc.update.conf";

// The directories in which requested files are prepared.
inline constexpr char kDumpDir[] = "/tmp/quendel/coredump";
inline constexpr char kDebugDir[] = "/tmp/quendel/debugdat";

// A support session: what whoever opened it left to be undone, and the account's home.
inline constexpr char kRemoteConfFile[] = "/usr/arvo/etc/quendel.remote.conf";
inline constexpr char kSupportHome[] = "/run/quendelhome";
inline constexpr char kSupportSshDir[] = "/run/quendelhome/.ssh";
inline constexpr char kAuthorizedKeysName[] = "authorized_keys";
inline constexpr char kAuthorizedKeysFile[] = "/run/quendelhome/.ssh/authorized_keys";

// The settings of quendelctl itself.
inline constexpr char kQuendelctlConfFile[] = "/usr/arvo/etc/quendelctl.conf";

// What the programs that run collections agree on: at most one run at a time.
inline constexpr char kProgramsRunDir[] = "/run/quendel";
inline constexpr char kCollectLockName[] = "collect.lock";
inline constexpr char kCollectLockFile[] = "/run/quendel/collect.lock";

}  // namespace quendel

#endif  // BASE_PATHS_H_
