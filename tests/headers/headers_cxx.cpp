// Every installed header in C++ (built as C++17 and C++20 with -pedantic).
#include <TekoJEncoder.h>
#include <TekoJEncoder.hpp>
#include <TekoJEncoderInternal.h>
