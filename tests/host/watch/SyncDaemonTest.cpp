#include "host/watch/SyncDaemon.h"

#include <gtest/gtest.h>

#include <cerrno>

#include "host/plan/TransferError.h"
#include "platform/Error.h"

namespace appsync {
namespace {

ErrorRecord errorOf(std::string_view domain, std::int64_t code) {
    return ErrorRecord::make(domain, code, "text");
}

TEST(SyncDaemon, WhatMayPassIsRecoverable) {
    const SyncDaemon daemon;
    EXPECT_TRUE(daemon.isRecoverableError(errorOf(kPosixErrorDomain, ENOSPC)));
    EXPECT_TRUE(daemon.isRecoverableError(errorOf(kPosixErrorDomain, EIO)));
    EXPECT_TRUE(daemon.isRecoverableError(errorOf(kTransferErrorDomain, kTransferInterrupted)));
    EXPECT_TRUE(daemon.isRecoverableError(errorOf(kTransferErrorDomain, kTransferCutShort)));
}

TEST(SyncDaemon, WhatStaysIsNotRecoverable) {
    const SyncDaemon daemon;
    EXPECT_FALSE(daemon.isRecoverableError(errorOf(kPosixErrorDomain, kPosixInvalidArgument)));
    EXPECT_FALSE(daemon.isRecoverableError(errorOf(kPosixErrorDomain, ENOENT)));
    EXPECT_FALSE(daemon.isRecoverableError(errorOf(kTransferErrorDomain, kTransferNoPackage)));
    EXPECT_FALSE(daemon.isRecoverableError(errorOf(kTransferErrorDomain, kTransferIllegalName)));
    EXPECT_FALSE(daemon.isRecoverableError(errorOf(kRegistryErrorDomain, 1)));
}

TEST(SyncDaemon, IsTheDaemonThatThePlugInExpects) {
    EXPECT_EQ(SyncDaemon().mainBundleIdentifier(), "com.korvu.trd");
}

}  // namespace
}  // namespace appsync
