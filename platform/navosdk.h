// Our stand-ins for the platform's user, group, share, file-system and indexing
// services. Internal: linked into libtorvale.so, not exported.
#pragma once

// 1 when the user is a member of the group "administrators", 0 when not, -1 on failure
// (unknown user; the last-error code says why).
int NAVOGroupIsAdminGroupMem(const char *user) noexcept;
