#pragma once

#include <string>

#include <gtest/gtest.h>
#include <marubackup-util/session.h>

#include "support/session_areas.h"

/** Where tests put records away for a while. */
const std::string ASIDE = "/var/run/aside";

/** Sessions in a /tmp of their own, and a folder outside of all of them in which nothing may ever be missing. */
class ASession : public testing::Test {
protected:
    static void expectKept(const MARU::Backup::Session& session);
    static void expectGone(const std::string& id, const std::string& path);

    const support::SessionAreas areas;
    const support::FilesOutside outside;
};

/** Makes a chain of folders with a file in each, which may be too deep to be named by one path. */
void makeDeepTree(const std::string& folder, int depth);
