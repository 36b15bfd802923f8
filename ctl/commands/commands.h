// One function a command: adds its sub-command, whose callback runs it and stores its status.
#pragma once

namespace CLI {
class App;
}
struct Invocation;

void addBuild(CLI::App &application, Invocation &invocation);
void addLint(CLI::App &application, Invocation &invocation);
void addNew(CLI::App &application, Invocation &invocation);
void addShow(CLI::App &application, Invocation &invocation);
void addStatus(CLI::App &application, Invocation &invocation);
void addHistory(CLI::App &application, Invocation &invocation);
void addVerify(CLI::App &application, Invocation &invocation);
void addLog(CLI::App &application, Invocation &invocation);
void addCompletion(CLI::App &application, Invocation &invocation);
void addCheck(CLI::App &application, Invocation &invocation);
void addApply(CLI::App &application, Invocation &invocation);
void addUndo(CLI::App &application, Invocation &invocation);
void addRecover(CLI::App &application, Invocation &invocation);
