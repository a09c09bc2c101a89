// Calls that fail on demand, counted and recorded.
//
// The test program is linked so that the library's calls of certain functions pass through here
// (the faults_*.cpp files name them). Nothing changes until a test asks for it, but for sleep(),
// which never waits.
//
// A call that an operation of the platform makes is counted apart, as "platform:" and the
// function's name: FailCall("chmod", 1, -1) is about the library's own first call of chmod,
// FailCall("platform:rename", 1, -1) about one that, say, ALIBCFileSetKeyValue makes.
//
// A forked child goes on with a copy of the counts and faults; its calls are not counted in the
// parent. Records are shared.
#ifndef SUPPORT_FAULTS_H_
#define SUPPORT_FAULTS_H_

#include <functional>
#include <string>
#include <vector>

namespace quendel::test {

// Makes the nth call from now on (1 is the next; 0 is each one) return `result`, with errno set to
// errnoValue unless that is 0, instead of doing its work. Where the function returns a pointer, 0
// is null and -1 the address that shmat() fails with.
void FailCall(const char* function, int nth, long result, int errnoValue = 0);

// Returns how often the function was called since the program's start or the last ResetCalls().
int Calls(const char* function);

// Starts the counts again, and forgets faults, records and slept seconds.
void ResetCalls();

// Keeps the arguments of each call of this function from now on: texts, lists of texts and numbers,
// with "|" between them. Of curl_easy_setopt it is the option's number.
void Record(const char* function);

// Returns what was kept, of all recorded functions together, in the order of the calls.
std::vector<std::string> Recorded();

// Runs at each counted sleep.
void OnSleep(std::function<void()> action);

// Returns the seconds that this process would have slept.
int SleptSeconds();

}  // namespace quendel::test

#endif  // SUPPORT_FAULTS_H_
