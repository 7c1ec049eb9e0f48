#include <iostream>

#include <marubackup/controller.h>

int main() {
    MARU::Backup::Job job("tarbackup", MARU::Backup::Job::ACTION_BACKUP);
    job.setParam("source", "/volume1/photos");
    MARU::Backup::JobController controller;
    const int code = controller.addJob(job);
    std::cout << code << ' ' << job << '\n';
}
