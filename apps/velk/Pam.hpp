// Console logins and password changes through PAM, service VELK_APP.
#pragma once

#include <string>

namespace Velk {

// Checks a login: pam_authenticate and then pam_acct_mgmt, both PAM_SILENT,
// with a conversation that answers every prompt with the secret. Returns the
// PAM code (0 for success, 6 PAM_PERM_DENIED when the account may not log in).
int PamLogin(const std::string& user, const std::string& secret);

// Changes the user's password (pam_chauthtok). Prompts that ask for the old or
// current password get oldSecret, every other prompt newSecret. Returns the
// PAM code.
int PamChangePassword(const std::string& user, const std::string& oldSecret, const std::string& newSecret);

// Overwrites the secret's bytes, then empties it.
void WipeSecret(std::string& secret);

}  // namespace Velk
