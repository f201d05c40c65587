#pragma once

namespace kvr::bench {

// Each measures one subject and prints its rows of the table.

void lookUp();
void manyInFlight();
void firstCall();
void allInfos();
void start();
void memory();
void growth();
void wakeUps();
void store();
void request();
void refresh();
void codecs();

}  // namespace kvr::bench
