// Marks what the client library's shared object exports. All other symbols are hidden.
#pragma once

#define VESK_API __attribute__((visibility("default")))
