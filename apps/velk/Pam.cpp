#include "Pam.hpp"

#include <security/pam_appl.h>
#include <strings.h>

#include <cstdlib>
#include <cstring>

#include "Console.hpp"

namespace Velk {

namespace {

struct Answers {
    const std::string* oldSecret;  // null: every prompt gets newSecret
    const std::string* newSecret;
};

bool AsksForOldSecret(const char* prompt) {
    return prompt && (strcasestr(prompt, "old") || strcasestr(prompt, "current"));
}

void FreeResponses(pam_response* responses, int count) {
    for (int i = 0; i < count; ++i) {
        if (responses[i].resp) {
            explicit_bzero(responses[i].resp, std::strlen(responses[i].resp));
            free(responses[i].resp);
        }
    }
    free(responses);
}

// Answers the prompts of the PAM modules from the secrets given; the modules
// own (and free) the copies handed to them.
int Converse(int count, const pam_message** messages, pam_response** out, void* data) {
    if (count <= 0 || !out || !data) return PAM_CONV_ERR;
    const Answers& answers = *static_cast<const Answers*>(data);
    auto* responses = static_cast<pam_response*>(calloc(size_t(count), sizeof(pam_response)));
    if (!responses) return PAM_BUF_ERR;
    for (int i = 0; i < count; ++i) {
        const int style = messages[i]->msg_style;
        if (style != PAM_PROMPT_ECHO_OFF && style != PAM_PROMPT_ECHO_ON) continue;
        const std::string& secret =
            answers.oldSecret && AsksForOldSecret(messages[i]->msg) ? *answers.oldSecret : *answers.newSecret;
        responses[i].resp = strdup(secret.c_str());
        if (!responses[i].resp) {
            FreeResponses(responses, count);
            return PAM_BUF_ERR;
        }
    }
    *out = responses;
    return PAM_SUCCESS;
}

}  // namespace

int PamLogin(const std::string& user, const std::string& secret) {
    Answers answers{nullptr, &secret};
    const pam_conv conversation{Converse, &answers};
    pam_handle_t* handle = nullptr;
    int rc = pam_start(VELK_APP, user.c_str(), &conversation, &handle);
    if (rc != PAM_SUCCESS) return rc;
    rc = pam_authenticate(handle, PAM_SILENT);
    if (rc == PAM_SUCCESS) rc = pam_acct_mgmt(handle, PAM_SILENT);
    pam_end(handle, rc);
    return rc;
}

int PamChangePassword(const std::string& user, const std::string& oldSecret, const std::string& newSecret) {
    Answers answers{&oldSecret, &newSecret};
    const pam_conv conversation{Converse, &answers};
    pam_handle_t* handle = nullptr;
    int rc = pam_start(VELK_APP, user.c_str(), &conversation, &handle);
    if (rc != PAM_SUCCESS) return rc;
    rc = pam_chauthtok(handle, PAM_SILENT);
    pam_end(handle, rc);
    return rc;
}

void WipeSecret(std::string& secret) {
    // The whole buffer: bytes past the end may hold an earlier, longer text.
    explicit_bzero(secret.data(), secret.capacity());
    secret.clear();
    secret.shrink_to_fit();
}

}  // namespace Velk
