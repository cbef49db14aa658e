#pragma once
// The fixed parts of what the module writes to the system log. Every message begins "SOURCE:LINE ";
// log filters know the messages by these two values, so they are constants and do not follow the
// code when it moves.

inline constexpr char kBaseLogSource[] = "webfm_webapi";
inline constexpr char kLogSource[] = "NUVA.Arbory.Search";

namespace log_line {

inline constexpr int kRunIdentity = 54;

inline constexpr int kUnknownSignal = 57;
inline constexpr int kWalkNoTaskData = 100;
inline constexpr int kWalkTaskWrite = 119;
inline constexpr int kBadCriteria = 251;
inline constexpr int kWalkFailed = 281;
inline constexpr int kSelectFailed = 451;
inline constexpr int kListIdentity = 528;
inline constexpr int kListNotReady = 540;
inline constexpr int kListNoTaskData = 546;
inline constexpr int kInvalidPid = 580;
inline constexpr int kKillFailed = 586;
inline constexpr int kStopNotReady = 620;
inline constexpr int kStopNoTaskData = 624;
inline constexpr int kCleanFork = 668;
inline constexpr int kCleanNotReady = 682;
inline constexpr int kCleanNoTaskData = 687;
inline constexpr int kCleanAllFork = 741;
inline constexpr int kCleanAllEscape = 764;
inline constexpr int kSettingsUnreadable = 801;
inline constexpr int kStartFork = 862;
inline constexpr int kStartTaskWrite = 873;
inline constexpr int kWorkerIdentity = 891;
inline constexpr int kWorkerNoTaskData = 909;
inline constexpr int kWorkerTaskWrite = 923;
inline constexpr int kHomeLookup = 950;
inline constexpr int kHomeOutsideHomes = 955;
inline constexpr int kHistoryGet = 1060;
inline constexpr int kHistorySet = 1089;
inline constexpr int kHistoryDelete = 1111;

}  // namespace log_line
