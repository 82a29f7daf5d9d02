// Where the appliance keeps its settings. The sandbox and a real installation provide them;
// NORVO_ROOT_PREFIX (environment) is not consulted: the paths are those of the appliance.
#pragma once

#define QUIB_INFO_CONF "/etc/quibinfo.conf"                         // appliance settings
#define QUIB_INFO_DEFAULTS_CONF "/etc.defaults/quibinfo.conf"       // factory defaults
#define QUIB_SHARE_CONF "/usr/quib/etc/shares.conf"                 // shared folders, smb.conf syntax
#define QUIB_APP_PRIVILEGE_CONF "/usr/quib/etc/app_privilege.conf"  // application privileges
#define QUIB_LOGIN_DIR "/run/norvo"                                 // root's own, 0700
#define QUIB_LOGIN_DB_NAME "quib_login.db"                          // login records (SQLite)
#define QUIB_LOGIN_DB QUIB_LOGIN_DIR "/" QUIB_LOGIN_DB_NAME
#define QUIB_AUTOBLOCK_DB_NAME "autoblock.db"  // failed logins per address (SQLite)
#define QUIB_AUTOBLOCK_DB QUIB_LOGIN_DIR "/" QUIB_AUTOBLOCK_DB_NAME
#define QUIB_ADMIN_GROUP "administrators"
#define QUIB_TASK_DIR "/run/quib_tasks"  // root's, 0711: one directory per task owner below
#define QUIB_TASK_DB_NAME "tasks.db"     // an owner's task records (SQLite), in the owner's 0700 directory
