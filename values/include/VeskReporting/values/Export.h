// What the client library's shared object exports; everything else in it is hidden.
#pragma once

#define VESK_API __attribute__((visibility("default")))
