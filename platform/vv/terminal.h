// Questions to a person.
#ifndef PLATFORM_VV_TERMINAL_H
#define PLATFORM_VV_TERMINAL_H

#include <string>

namespace vv {

// What became of a question.
enum class Answer {
  kYes,
  kNo,
  kNobody,  // there is no terminal to ask at
};

// Asks at the process's terminal; only "y" and "yes" mean yes.
Answer ask(const std::string& question);

// Asks for a text that is not shown, at the process's terminal. A signal that comes meanwhile is obeyed once
// the terminal is as before. Returns false when there is no terminal, or nothing was typed.
bool ask_secret(const std::string& question, std::string& secret);

}  // namespace vv

#endif
