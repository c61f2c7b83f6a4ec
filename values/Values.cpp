// Compiles the functions that programs outside this project get inline.
#include <VeskReporting/values/Value.h>

#include <VeskReporting/values/Describe-inl.h>
#include <VeskReporting/values/Text-inl.h>
#include <VeskReporting/values/Value-inl.h>
