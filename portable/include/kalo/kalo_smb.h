// The SMB file server's settings that the package changes: only the
// Spotlight search support, which lets network clients search the index. On
// Linux the setting is kept in a small JSON file of the platform's own,
// "/etc/orvex/smb.json" (under ORVEX_ROOT), as {"spotlight": true|false};
// other members of the file are kept as they are. The file server's
// configuration is generated from it when the server ("samba") is restarted,
// which is the caller's business. Thread-safe; between processes the last
// writer wins, and readers always see a whole file.
// Who may include it: in the library, only the platform layer (src/platform/),
// the one door through which every subsystem reaches the platform, and the
// foundation beneath it; the programs and the tests may include it freely.
#ifndef KALO_KALO_SMB_H_
#define KALO_KALO_SMB_H_

constexpr char kSMBSettingsPath[] = "/etc/orvex/smb.json";

// 1 when Spotlight support is on, 0 when it is off or was never set (no
// file, or no "spotlight" member). -1 with KLIB_ERR_IO when the file exists
// but cannot be read, or is not a JSON object whose "spotlight" is a bool.
int KALOSMBIsEnableSpotlight();

// Switches Spotlight support on (on != 0) or off, creating the file and its
// directory when missing. Returns 0; -1 with KLIB_ERR_IO when the existing
// file cannot be read or parsed (it is then left alone) or the new one
// cannot be written (the old one is then intact).
int KALOSMBSetSpotlight(int on);

#endif  // KALO_KALO_SMB_H_
