// A word to people when the program waits for another one.
#pragma once

namespace tavisched {

// From now on, what this process has waited for longer than a second is named on standard error:
// another process whose change goes on, or a program that it started itself, such as a plug-in
// handler.
void tellOfWaiting();
// What is waited for from now on was asked for.
void tellNoMoreOfWaiting();

} // namespace tavisched
