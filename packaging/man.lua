-- A pandoc filter: formats manual pages made from docs/reference in the usual form of manual pages.

-- An item of a list is a term and its description, which begins after the first colon.
function BulletList(list)
  local items = {}
  for _, blocks in ipairs(list.content) do
    local inlines = blocks[1].content
    local term, text = pandoc.Inlines{}, pandoc.Inlines{}
    local found = false
    for _, inline in ipairs(inlines) do
      if not found and inline.t == "Str" and inline.text:match(":$") then
        found = true
        if inline.text ~= ":" then term:insert(pandoc.Str(inline.text:sub(1, -2))) end
      elseif found then
        text:insert(inline)
      else
        term:insert(inline)
      end
    end
    if not found then return nil end
    while #text > 0 and (text[1].t == "Space" or text[1].t == "SoftBreak") do text:remove(1) end
    items[#items + 1] = {term, {{pandoc.Plain(text)}}}
  end
  return pandoc.DefinitionList(items)
end

-- The text of a link already names the page.
function Link(link)
  return pandoc.Strong(link.content)
end

-- Terminals have no second font, so code is bold.
function Code(code)
  return pandoc.Strong{pandoc.Str(code.text)}
end

function CodeBlock(block)
  local text = block.text:gsub("\\", "\\e"):gsub("\n([.'])", "\n\\&%1"):gsub("^([.'])", "\\&%1"):gsub("-", "\\-")
  return pandoc.RawBlock("man", ".IP\n.EX\n" .. text .. "\n.EE")
end
