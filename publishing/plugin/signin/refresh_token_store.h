#pragma once

// The refresh token of the YouTube account a user signed in with, kept in the desktop's secret
// store (the Secret Service or KWallet, through QtKeychain), never in a plain file, so that a later
// publish signs in without the browser. One token per OAuth client. Without a secret store the
// token is simply not kept: every publish then signs in in the browser, and the reason is logged.
//
// Asynchronous. Call on the main thread; the completions run on the main thread.

#include "platform/error.h"

#include <QString>

#include <functional>

namespace zaf::publishing {

// The stored token for `clientId`, or an empty string when there is none or no secret store.
void readRefreshToken(const QString &clientId, std::function<void(const QString &token)> completion);
// Keeps `token` for `clientId`, replacing the one kept.
void storeRefreshToken(const QString &clientId, const QString &token, std::function<void(OptionalError)> completion = {});
// Forgets the token kept for `clientId`; none kept is no error.
void forgetRefreshToken(const QString &clientId, std::function<void(OptionalError)> completion = {});

} // namespace zaf::publishing
