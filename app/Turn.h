// The turn of a run: one run of the tool at a time.
//
// Two at once would delete each other's temporary location between making it and making it current, and a
// current location that does not exist leads nowhere back.
#pragma once

class Turn {
  public:
    // Waits until no other run has the turn, for two minutes at most, which is longer than a run can take;
    // what then keeps it is in the system log, and this run goes on all the same, as without a file to take a
    // turn with. Without the rights to take one there is nothing to change either.
    Turn();
    // The turn ends with the object, or with the process.
    ~Turn();
    Turn(const Turn&) = delete;
    Turn& operator=(const Turn&) = delete;

  private:
    int descriptor = -1;
};

// Lets other runs have their turn while this object lives: this run waits for its user, for ever if need be,
// and "remove" has to be able to lead back meanwhile. Does nothing in a process that has no turn.
class TurnPause {
  public:
    TurnPause();
    ~TurnPause();
    TurnPause(const TurnPause&) = delete;
    TurnPause& operator=(const TurnPause&) = delete;
};
