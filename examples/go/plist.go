// SPDX-License-Identifier: Apache-2.0

// Binary property lists, as far as a client needs them: docs/wire-protocol.md.
package main

import (
	"encoding/binary"
	"errors"
	"fmt"
	"math"
	"sort"
	"time"
	"unicode/utf16"
)

const (
	magic    = "bplist00"
	deepest  = 64
	trailing = 32
)

var (
	errUnreadable = errors.New("a body that is no readable property list")
	epoch         = time.Date(2001, 1, 1, 0, 0, 0, 0, time.UTC)
)

// encode writes values of the types bool, int64, float64, string, []interface{} and dictionary; others panic.
func encode(body dictionary) []byte {
	e := encoder{data: []byte(magic)}
	top := e.add(body)
	table := len(e.data)
	for _, offset := range e.offsets {
		e.data = binary.BigEndian.AppendUint32(e.data, uint32(offset))
	}
	e.data = append(e.data, 0, 0, 0, 0, 0, 0, 4, 4)
	for _, number := range []int{len(e.offsets), top, table} {
		e.data = binary.BigEndian.AppendUint64(e.data, uint64(number))
	}
	return e.data
}

type encoder struct {
	data    []byte
	offsets []int
}

// add writes the value after those that it consists of, and returns its number.
func (e *encoder) add(value interface{}) int {
	var parts []interface{}
	if list, ok := value.([]interface{}); ok {
		parts = list
	} else if entries, ok := value.(dictionary); ok {
		keys := make([]string, 0, len(entries))
		for key := range entries {
			keys = append(keys, key)
		}
		sort.Strings(keys)
		for _, key := range keys {
			parts = append(parts, key)
		}
		for _, key := range keys {
			parts = append(parts, entries[key])
		}
	}
	references := []byte{}
	for _, part := range parts {
		references = binary.BigEndian.AppendUint32(references, uint32(e.add(part)))
	}
	e.offsets = append(e.offsets, len(e.data))
	switch v := value.(type) {
	case bool:
		if v {
			e.data = append(e.data, 0x09)
		} else {
			e.data = append(e.data, 0x08)
		}
	case int64:
		e.data = binary.BigEndian.AppendUint64(append(e.data, 0x13), uint64(v))
	case float64:
		e.data = binary.BigEndian.AppendUint64(append(e.data, 0x23), math.Float64bits(v))
	case string:
		e.text(v)
	case []interface{}:
		e.count(0xA0, len(v))
	case dictionary:
		e.count(0xD0, len(v))
	default:
		panic(fmt.Sprintf("a message cannot hold %T", value))
	}
	e.data = append(e.data, references...)
	return len(e.offsets) - 1
}

func (e *encoder) count(kind byte, n int) {
	if n < 15 {
		e.data = append(e.data, kind|byte(n))
	} else {
		e.data = binary.BigEndian.AppendUint32(append(e.data, kind|15, 0x12), uint32(n))
	}
}

func (e *encoder) text(text string) {
	ascii := true
	for i := 0; i < len(text); i++ {
		ascii = ascii && text[i] < 0x80
	}
	if ascii {
		e.count(0x50, len(text))
		e.data = append(e.data, text...)
		return
	}
	units := utf16.Encode([]rune(text))
	e.count(0x60, len(units))
	for _, unit := range units {
		e.data = binary.BigEndian.AppendUint16(e.data, unit)
	}
}

// decode reads a body. Integers become int64, or uint64 if they are larger.
func decode(data []byte) (dictionary, error) {
	if len(data) < len(magic)+trailing || string(data[:len(magic)]) != magic {
		return nil, errUnreadable
	}
	trailer := data[len(data)-trailing:]
	d := decoder{data: data[:len(data)-trailing], offsetSize: int(trailer[6]), referenceSize: int(trailer[7])}
	d.objects, d.table = binary.BigEndian.Uint64(trailer[8:]), binary.BigEndian.Uint64(trailer[24:])
	value, err := d.object(binary.BigEndian.Uint64(trailer[16:]), deepest)
	if body, ok := value.(dictionary); ok && err == nil {
		return body, nil
	}
	return nil, errUnreadable
}

type decoder struct {
	data                      []byte // without the trailer
	offsetSize, referenceSize int
	objects, table            uint64
}

// bytes returns n bytes at a place, if they are there.
func (d *decoder) bytes(at, n uint64) ([]byte, error) {
	if at > uint64(len(d.data)) || n > uint64(len(d.data))-at {
		return nil, errUnreadable
	}
	return d.data[at : at+n], nil
}

func (d *decoder) number(at uint64, size int) (uint64, error) {
	part, err := d.bytes(at, uint64(size))
	value := uint64(0)
	for _, one := range part {
		value = value<<8 | uint64(one)
	}
	return value, err
}

// object reads the object of this number.
func (d *decoder) object(number uint64, depth int) (interface{}, error) {
	if number >= d.objects || depth == 0 {
		return nil, errUnreadable
	}
	at, err := d.number(d.table+number*uint64(d.offsetSize), d.offsetSize)
	if err != nil {
		return nil, err
	}
	first, err := d.number(at, 1)
	if err != nil {
		return nil, err
	}
	at++
	kind, n := first&0xF0, first&0x0F
	if kind >= 0x40 && n == 15 {
		size, err := d.number(at, 1)
		if err != nil || size&0xF0 != 0x10 || size > 0x13 {
			return nil, errUnreadable
		}
		if n, err = d.number(at+1, 1<<(size&0x0F)); err != nil {
			return nil, err
		}
		at += 1 + 1<<(size&0x0F)
	}
	switch {
	case first == 0x08 || first == 0x09:
		return first == 0x09, nil
	case kind == 0x10 && n <= 3:
		value, err := d.number(at, 1<<n)
		return int64(value), err
	case first == 0x14:
		return d.number(at+8, 8)
	case first == 0x22:
		value, err := d.number(at, 4)
		return float64(math.Float32frombits(uint32(value))), err
	case first == 0x23 || first == 0x33:
		value, err := d.number(at, 8)
		seconds := math.Float64frombits(value)
		if first == 0x33 {
			return epoch.Add(time.Duration(seconds * float64(time.Second))), err
		}
		return seconds, err
	case kind == 0x40:
		return d.bytes(at, n)
	case kind == 0x50:
		text, err := d.bytes(at, n)
		return string(text), err
	case kind == 0x60:
		return d.utf16(at, n)
	case kind == 0xA0:
		return d.parts(at, n, depth)
	case kind == 0xD0:
		return d.dictionary(at, n, depth)
	}
	return nil, errUnreadable
}

func (d *decoder) utf16(at, n uint64) (string, error) {
	if n > uint64(len(d.data)) {
		return "", errUnreadable
	}
	part, err := d.bytes(at, 2*n)
	units := make([]uint16, len(part)/2)
	for i := range units {
		units[i] = binary.BigEndian.Uint16(part[2*i:])
	}
	return string(utf16.Decode(units)), err
}

// parts reads the objects that n references name.
func (d *decoder) parts(at, n uint64, depth int) ([]interface{}, error) {
	parts := []interface{}{}
	for ; n > 0; n-- {
		reference, err := d.number(at, d.referenceSize)
		if err != nil {
			return nil, err
		}
		part, err := d.object(reference, depth-1)
		if err != nil {
			return nil, err
		}
		parts = append(parts, part)
		at += uint64(d.referenceSize)
	}
	return parts, nil
}

func (d *decoder) dictionary(at, n uint64, depth int) (dictionary, error) {
	parts, err := d.parts(at, 2*n, depth)
	if err != nil {
		return nil, err
	}
	made := dictionary{}
	for i, key := range parts[:n] {
		name, ok := key.(string)
		if !ok {
			return nil, errUnreadable
		}
		made[name] = parts[n+uint64(i)]
	}
	return made, nil
}
