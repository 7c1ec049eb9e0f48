// What it is all for: a backup through the queue, and back.

#include <filesystem>

#include "daemon_test.h"
#include "support/backend_files.h"
#include "support/files.h"

using namespace MARU::Backup;
namespace fs = std::filesystem;

namespace {

class MainJob : public DaemonTest {
protected:
    MainJob() : source(folder.path("source")), archive(folder.path("archive.tar")), target(folder.path("target")) {
        support::writeSystemBackend("tarred", "[backup]\n"
                                              "command_check = test -d {{source}}\n"
                                              "command_launch = tar -cf {{archive}} -C {{source}} .\n"
                                              "pipe_stderr = {{archive}}.log\n"
                                              "[restore]\n"
                                              "command_launch = tar -xf {{archive}} -C {{target}}\n");
        fs::create_directories(source + "/photos/2024");
        support::writeFile(source + "/photos/2024/one.jpg", std::string(300000, '\x7f'));
        support::writeFile(source + "/a name with blanks and \xff", "text\n");
        fs::create_directory(target);
    }

    Job jobFor(Job::Action action) {
        Job job("tarred", action);
        job.setParam("source", source);
        job.setParam("archive", archive);
        job.setParam("target", target);
        return job;
    }

    const std::string source;
    const std::string archive;
    const std::string target;
};

} // namespace

TEST_F(MainJob, ABackupReachesTheDiskAndComesBack) {
    start();

    const Job backup = add(jobFor(Job::ACTION_BACKUP));
    EXPECT_EQ(1, backup.getJobId());
    EXPECT_EQ(Job::STATUS_QUEUED, backup.getStatus());
    EXPECT_EQ("_job_id.{{job_id}}", backup.getUniqueString());
    daemon->waitForLine(exitLine(backup, 0));
    EXPECT_EQ("", support::readFile(archive + ".log"));

    const Job restore = add(jobFor(Job::ACTION_RESTORE));
    daemon->waitForLine(exitLine(restore, 0));
    EXPECT_EQ(support::readFile(source + "/photos/2024/one.jpg"), support::readFile(target + "/photos/2024/one.jpg"));
    EXPECT_EQ("text\n", support::readFile(target + "/a name with blanks and \xff"));
}

TEST_F(MainJob, ACheckCommandKeepsAJobWithoutItsSourceOut) {
    start();
    Job job = jobFor(Job::ACTION_BACKUP);
    job.setParam("source", source + "/nowhere");

    EXPECT_EQ(400, controller.addJob(job));
    daemon->waitForLine("invalid job");
    EXPECT_FALSE(fs::exists(archive));
    EXPECT_EQ(-1, job.getJobId());
}

TEST_F(MainJob, EachStepStandsInTheDiary) {
    start();
    const Job job = add(jobFor(Job::ACTION_BACKUP));
    daemon->waitForLine(exitLine(job, 0));

    daemon->waitForLine("enqueue job [" + job.toString() + "]");
    daemon->waitForLine("launch job [" + job.toString() + "]");
    daemon->waitForLineStarting("launch job [1] on pid [");
    EXPECT_LT(placeInDiary("enqueue job [" + job.toString() + "]"),
              placeInDiary("launch job [" + job.toString() + "]"));
}

TEST_F(MainJob, WithoutDebugTheDiaryHasNoDebugLines) {
    support::DaemonOptions quiet;
    quiet.arguments = {};
    start(quiet);
    const Job job = add(jobFor(Job::ACTION_BACKUP));
    daemon->waitForLine(exitLine(job, 0));

    for (const std::string& line : daemon->diary()) {
        EXPECT_EQ(std::string::npos, line.find("scan to launch")) << line;
        EXPECT_EQ(std::string::npos, line.find("check children status")) << line;
        EXPECT_NE(0U, line.rfind("request [", 0)) << line;
    }
}

TEST_F(MainJob, WithDebugTheDiaryTellsRequestsScansAndLooksAtTheChildren) {
    start();
    const Job job = add(jobFor(Job::ACTION_BACKUP));
    daemon->waitForLine(exitLine(job, 0));

    daemon->waitForLineStarting("request [{\"job\":");
    daemon->waitForLine("scan to launch");
    daemon->waitForLine("[sigchild] check children status");
    daemon->waitForLine("[loop] check children status");
}

TEST_F(MainJob, IdsBeginAtOneAgainWithANewDaemon) {
    start();
    const Job first = add(jobFor(Job::ACTION_BACKUP));
    EXPECT_EQ(1, first.getJobId());
    daemon->waitForLine(exitLine(first, 0)); // until then the second one is the same work
    EXPECT_EQ(2, add(jobFor(Job::ACTION_BACKUP)).getJobId());
    daemon->stop(SIGTERM);

    start();
    JobController anew;
    Job job = jobFor(Job::ACTION_BACKUP);
    EXPECT_EQ(200, anew.addJob(job));
    EXPECT_EQ(1, job.getJobId());
}
