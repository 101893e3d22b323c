#include "programs/fileindex-web/pam_sign_in.h"

#include <security/pam_appl.h>

#include <cstdlib>
#include <cstring>

namespace corvlumex {
namespace web {
namespace {

// Answers every password prompt with the password given; PAM frees the
// answers it receives.
int Converse(int count, const struct pam_message** messages, struct pam_response** responses, void* data) {
  if (count <= 0 || count > PAM_MAX_NUM_MSG) return PAM_CONV_ERR;
  auto* answers = static_cast<pam_response*>(calloc(static_cast<size_t>(count), sizeof(pam_response)));
  if (answers == nullptr) return PAM_BUF_ERR;
  const char* password = static_cast<const char*>(data);
  for (int i = 0; i < count; ++i) {
    if (messages[i]->msg_style == PAM_PROMPT_ECHO_OFF || messages[i]->msg_style == PAM_PROMPT_ECHO_ON) {
      answers[i].resp = strdup(password);
    }
  }
  *responses = answers;
  return PAM_SUCCESS;
}

}  // namespace

bool PamSignIn(const std::string& service, const std::string& user, const std::string& password, std::string* why) {
  struct pam_conv conversation = {Converse, const_cast<char*>(password.c_str())};
  pam_handle_t* handle = nullptr;
  int status = pam_start(service.c_str(), user.c_str(), &conversation, &handle);
  if (status == PAM_SUCCESS) status = pam_authenticate(handle, PAM_SILENT | PAM_DISALLOW_NULL_AUTHTOK);
  if (status == PAM_SUCCESS) status = pam_acct_mgmt(handle, PAM_SILENT | PAM_DISALLOW_NULL_AUTHTOK);
  if (status != PAM_SUCCESS && why != nullptr) *why = pam_strerror(handle, status);
  if (handle != nullptr) pam_end(handle, status);
  return status == PAM_SUCCESS;
}

}  // namespace web
}  // namespace corvlumex
