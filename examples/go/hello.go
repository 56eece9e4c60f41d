// SPDX-License-Identifier: Apache-2.0

// Reports each line of its input over the wire protocol (docs/wire-protocol.md), with Go's standard library alone:
// go run hello.go plist.go. It goes on when the daemon restarts. The exit status is 1 if a message was lost.
package main

import (
	"bufio"
	"encoding/binary"
	"errors"
	"fmt"
	"io"
	"math/rand"
	"net"
	"os"
	"path/filepath"
	"time"
)

const (
	hello, call, reply, event, refusal = 1, 2, 3, 4, 5

	describe = "setSessionInfo:userInfo:frameworksToCheck:hasAggregationBlock:"
	start    = "startConfigWithCompletionHandler:"
	send     = "sendMessageWithCategory:type:payload:reply:"

	patience = 5 * time.Second // for the daemon's hello
)

type dictionary = map[string]interface{}

// connection is one connection to the daemon.
type connection struct {
	socket net.Conn
	calls  uint32 // made so far; each has its number as its ID
	ran    int64  // how many of them the daemon has run, by its "goodbye"; -1 without one
	unsent bool   // it has ended before it has taken a byte of the last call
}

// write does not report an error: what can be read then tells more.
func (c *connection) write(kind byte, id uint32, body dictionary) {
	data := encode(body)
	frame := make([]byte, 12, 12+len(data))
	binary.BigEndian.PutUint32(frame, uint32(len(data)))
	frame[4] = kind
	binary.BigEndian.PutUint32(frame[8:], id)
	taken, _ := c.socket.Write(append(frame, data...))
	c.unsent = taken == 0
}

func (c *connection) read() (kind byte, id uint32, body dictionary, err error) {
	header := make([]byte, 12)
	if _, err = io.ReadFull(c.socket, header); err != nil {
		return
	}
	data := make([]byte, binary.BigEndian.Uint32(header))
	if _, err = io.ReadFull(c.socket, data); err != nil {
		return
	}
	body, err = decode(data)
	return header[4], binary.BigEndian.Uint32(header[8:]), body, err
}

// ask makes a call and waits for its reply. After an error other than a refusedError the connection cannot be used.
func (c *connection) ask(op string, args dictionary) (dictionary, error) {
	c.calls++
	mine := c.calls
	c.write(call, mine, dictionary{"op": op, "args": args})
	for {
		kind, id, body, err := c.read()
		switch {
		case err != nil:
			return nil, err
		case kind == refusal:
			return nil, refused(body)
		case kind == event && body["op"] == "goodbye":
			args, _ := body["args"].(dictionary)
			c.ran, _ = args["calls"].(int64)
		case kind == reply && id == mine:
			if _, failed := body["error"]; failed {
				return nil, refused(body)
			}
			results, _ := body["results"].(dictionary)
			return results, nil
		}
	}
}

type refusedError struct{ error }

func refused(body dictionary) error {
	details, _ := body["error"].(dictionary)
	return refusedError{fmt.Errorf("the daemon refused: %v", details["description"])}
}

// connect makes a connection, on which the session is described and started.
func connect(path string) (*connection, error) {
	socket, err := net.DialTimeout("unix", path, patience)
	if err != nil {
		return nil, err
	}
	c := &connection{socket: socket, ran: -1}
	socket.SetDeadline(time.Now().Add(patience))
	c.write(hello, 0, dictionary{"wire": int64(1), "library": "hello.go"})
	kind, _, body, err := c.read()
	if err == nil && kind != hello {
		err = refused(body)
	}
	if err == nil {
		socket.SetDeadline(time.Time{})
		_, err = c.ask(describe, dictionary{
			"sessionInfo":         dictionary{"clientType": int64(7)},
			"userInfo":            dictionary{"clientName": "hello"},
			"hasAggregationBlock": false,
		})
	}
	if err == nil {
		_, err = c.ask(start, dictionary{})
	}
	if err != nil {
		socket.Close()
		return nil, err
	}
	return c, nil
}

// reconnect tries until there is a connection, at most 30 s apart.
func reconnect(path string) *connection {
	for most := 200 * time.Millisecond; ; most *= 2 {
		if most > 30*time.Second {
			most = 30 * time.Second
		}
		time.Sleep(most/2 + time.Duration(rand.Int63n(int64(most/2))))
		if c, err := connect(path); err == nil {
			return c
		}
	}
}

func main() {
	rand.Seed(time.Now().UnixNano())
	path := filepath.Join("/", os.Getenv("VELTRA_ROOT"), "run/veltrad/com.florn.veltrad.sock")
	c, err := connect(path)
	if err != nil {
		fmt.Fprintln(os.Stderr, err)
		os.Exit(1)
	}
	lost := 0
	for lines := bufio.NewScanner(os.Stdin); lines.Scan(); {
		message := dictionary{"category": int64(5), "type": int64(10), "payload": dictionary{"line": lines.Text()}}
		for {
			_, err := c.ask(send, message)
			if err == nil {
				break
			}
			if errors.As(err, &refusedError{}) {
				lost++
				break
			}
			// If it may have been run, it could arrive twice when it is sent again.
			again := c.unsent || (c.ran >= 0 && c.ran < int64(c.calls))
			c.socket.Close()
			c = reconnect(path)
			if !again {
				lost++
				break
			}
		}
	}
	if lost > 0 {
		fmt.Fprintln(os.Stderr, lost, "messages may be lost")
		os.Exit(1)
	}
}
