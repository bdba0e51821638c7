// Marks what the module exports: the factories and plain functions under
// undecorated names, and the connector classes with all their members. All
// else is built hidden, so `nm -D` shows just these.
#pragma once

#define ZQ_EXPORT __attribute__((visibility("default")))
