// Every operation of the public headers, with the signature that applications
// were written for. It compiles, or an application somewhere will not.

#include <sys/time.h>

#include <list>
#include <ostream>
#include <string>
#include <type_traits>
#include <utility>

#include <boost/function.hpp>
#include <json/value.h>

#include <marubackup/backend_manager.h>
#include <marubackup/command_client.h>
#include <marubackup/command_server.h>
#include <marubackup/controller.h>
#include <marubackup/job.h>
#include <marubackup/maru_archive_version.h>
#include <marubackup/queue_server.h>
#include <marubackup/system_status.h>
#include <marubackup/timed_session.h>

using namespace MARU::Backup;
using String = const std::string&;
using Jobs = std::list<Job>&;

namespace {

template <typename Signature, Signature Operation>
constexpr bool has = true;

static_assert(std::is_default_constructible_v<Job> && std::is_copy_constructible_v<Job> &&
              std::is_copy_assignable_v<Job> && std::is_constructible_v<Job, String, Job::Action>);
static_assert(std::is_same_v<int, std::underlying_type_t<Job::Action>>);
static_assert(std::is_same_v<int, std::underlying_type_t<Job::Status>>);
static_assert(has<int (Job::*)() const, &Job::getJobId> && has<void (Job::*)(int), &Job::setJobId>);
static_assert(has<std::string (Job::*)() const, &Job::getUniqueString> &&
              has<void (Job::*)(String), &Job::setUniqueString>);
static_assert(has<std::string (Job::*)() const, &Job::getBackend> && has<void (Job::*)(String), &Job::setBackend>);
static_assert(has<Job::Action (Job::*)() const, &Job::getAction> && has<void (Job::*)(Job::Action), &Job::setAction>);
static_assert(has<std::string (Job::*)() const, &Job::getCommandBranch> &&
              has<void (Job::*)(String), &Job::setCommandBranch>);
static_assert(has<Job::Status (Job::*)() const, &Job::getStatus> && has<void (Job::*)(Job::Status), &Job::setStatus>);
static_assert(has<int (Job::*)() const, &Job::getPid> && has<void (Job::*)(int), &Job::setPid>);
static_assert(has<Json::Value (Job::*)() const, &Job::getParams>);
static_assert(has<Json::Value (Job::*)(String, const Json::Value&) const, &Job::getParam>);
static_assert(has<bool (Job::*)(String) const, &Job::hasParam>);
static_assert(has<void (Job::*)(String, const Json::Value&), &Job::setParam>);
static_assert(has<Json::Value (Job::*)() const, &Job::toJson> &&
              has<bool (Job::*)(const Json::Value&), &Job::fromJson>);
static_assert(has<std::string (Job::*)() const, &Job::toString>);
static_assert(has<std::string (Job::*)(String) const, &Job::toFormatString>);
static_assert(has<bool (*)(const Job&), &Job::isValidToEnqueue>);
static_assert(std::is_same_v<std::ostream&, decltype(std::declval<std::ostream&>() << std::declval<const Job&>())>);
static_assert(has<std::string (*)(Job::Action), &action2str>);

static_assert(std::is_default_constructible_v<CommandClient> && !std::is_copy_constructible_v<CommandClient>);
static_assert(has<bool (CommandClient::*)(String), &CommandClient::connect>);
static_assert(has<bool (CommandClient::*)() const, &CommandClient::isConnected>);
static_assert(has<void (CommandClient::*)(), &CommandClient::close>);
static_assert(has<std::string (CommandClient::*)(String), &CommandClient::send>);

using Request = boost::function<std::string(const char*, unsigned int, CommandServer*)>;
static_assert(std::is_default_constructible_v<CommandServer> && !std::is_copy_constructible_v<CommandServer>);
static_assert(has<bool (CommandServer::*)(const Request&, String, int), &CommandServer::run>);
static_assert(
    has<bool (CommandServer::*)(const boost::function<void(void*)>&, timeval, void*), &CommandServer::setTimeout>);
static_assert(has<bool (CommandServer::*)(const boost::function<void()>&), &CommandServer::setLoopHandler>);
static_assert(has<bool (CommandServer::*)(int, const boost::function<void(int)>&), &CommandServer::setSignalHandler>);
static_assert(
    has<bool (CommandServer::*)(String, const boost::function<void(inotify_event*)>&), &CommandServer::setWatchFolder>);
static_assert(has<bool (*)(bool), &runQueueServer>);

static_assert(std::is_default_constructible_v<BackendManager> && !std::is_copy_constructible_v<BackendManager>);
static_assert(has<bool (BackendManager::*)(String, String), &BackendManager::load>);
static_assert(has<bool (*)(std::list<std::string>&), &BackendManager::listBackend>);
static_assert(has<bool (BackendManager::*)() const, &BackendManager::isDelegate>);
static_assert(has<std::string (BackendManager::*)() const, &BackendManager::getUniqueFormat>);
static_assert(has<std::string (BackendManager::*)(const Job&) const, &BackendManager::getJobUnique>);
static_assert(has<bool (BackendManager::*)(const Job&) const, &BackendManager::check>);
static_assert(has<bool (BackendManager::*)(const Job&) const, &BackendManager::launch>);

static_assert(std::is_default_constructible_v<JobController> && !std::is_copy_constructible_v<JobController>);
static_assert(has<int (JobController::*)(Job&), &JobController::addJob>);
static_assert(has<int (JobController::*)(int, Job&), &JobController::getJob>);
static_assert(has<int (JobController::*)(int), &JobController::removeJob>);
static_assert(has<int (JobController::*)(String, long), &JobController::cleanSession>);
static_assert(
    has<int (JobController::*)(Jobs, Job::Action, String, String, String, String), &JobController::listJobEx>);
static_assert(has<int (JobController::*)(Jobs), &JobController::listJobAll>);
static_assert(has<int (JobController::*)(Jobs, Job::Action, String), &JobController::listJobByAction>);
static_assert(has<int (JobController::*)(Jobs, String), &JobController::listJobByBackend>);
static_assert(has<int (JobController::*)(Jobs, String, String), &JobController::listJobByFormatString>);
static_assert(has<int (JobController::*)(Job&, String, Job::Action), &JobController::getJobByUnique>);

static_assert(has<bool (*)(Job::Action&), &System::canBackup> && has<bool (*)(), &System::canBackup>);
static_assert(has<bool (*)(Job::Action&), &System::canRestore> && has<bool (*)(), &System::canRestore>);
static_assert(has<bool (*)(Job::Action&), &System::canCopyTo> && has<bool (*)(), &System::canCopyTo>);
static_assert(has<bool (*)(String), &System::isBackupRunning> && has<bool (*)(String), &System::isRestoreRunning> &&
              has<bool (*)(String), &System::isCopyToRunning>);
static_assert(has<bool (*)(String), &System::isBackupRunningNotQueued>);
static_assert(has<bool (*)(String), &System::isRestoreRunningNotQueued>);
static_assert(has<bool (*)(String), &System::isCopyToRunningNotQueued>);

static_assert(std::is_default_constructible_v<TimedSession> && !std::is_copy_constructible_v<TimedSession>);
static_assert(TimedSession::TEMP_DEFAULT == 0 && TimedSession::TEMP_MAX_VOLUME == 1);
static_assert(has<bool (TimedSession::*)(TimedSession::TempType, long), &TimedSession::create>);
static_assert(has<bool (TimedSession::*)(String), &TimedSession::load>);
static_assert(has<std::string (TimedSession::*)() const, &TimedSession::getId> &&
              has<std::string (TimedSession::*)() const, &TimedSession::getPath>);
static_assert(has<bool (TimedSession::*)(), &TimedSession::destroy>);
static_assert(has<long (*)(String, long, bool), &TimedSession::destroyExpired>);

static_assert(has<int (*)(const char*, unsigned*), &MARUBackupArchVerGet>);
static_assert(has<int (*)(const char*, unsigned*), &MARUBackupFSArchVerGet>);
static_assert(has<int (*)(const char*, unsigned*), &MARUBackupFSArchVerIncrease>);
static_assert(has<int (*)(const char*, unsigned), &MARUBackupFileArchVerSet>);

} // namespace
