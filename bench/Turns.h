// Shows whose code runs within a call: the library's, or SQLite's. This program replaces the functions of
// SQLite that the library calls. Each of them begins a turn and then calls the real function; a row callback
// is the library's turn again.

#ifndef VEMO_ACCESS_TOKEN_BENCH_TURNS_H
#define VEMO_ACCESS_TOKEN_BENCH_TURNS_H

const int LIBRARY = 0; // the program chooses the numbers of the other turns

// The program defines these two: the turn of a call of SQLite ("open", "close" or the text of a statement),
// and what happens when a turn ends.
int turnOf(const char* szWhat);
void endTurn(int nTurn);

inline int g_nTurn = LIBRARY;

// A turn that lasts until the end of the scope.
class Turn {
public:
    explicit Turn(int nTurn) : m_nBefore(g_nTurn) { pass(nTurn); }
    ~Turn() { pass(m_nBefore); }
    Turn(const Turn&) = delete;
    Turn& operator=(const Turn&) = delete;

private:
    static void pass(int nTurn)
    {
        endTurn(g_nTurn);
        g_nTurn = nTurn;
    }

    const int m_nBefore;
};

#endif
